#include "tavrind/TAVRetryableNetworkRequest.h"

#include "platform/device/Device.h"
#include "platform/run/Clock.h"

namespace tavrin {
namespace {
constexpr std::chrono::milliseconds kDelayOnFail{1500};
}

std::shared_ptr<platform::UrlTask> dataTaskWithRetryableRequest(platform::Device& device,
                                                                std::shared_ptr<platform::UrlSession> session,
                                                                TAVRetryableNetworkRequest request, unsigned attempt,
                                                                unsigned retriesLeft, RetryCompletion completion)
{
    // The completion needs its own task for the timing data. The task owns the completion and outlives its run.
    auto cell = std::make_shared<std::weak_ptr<platform::UrlTask>>();
    const platform::UrlRequest httpRequest = request.httpRequest;
    auto task = session->dataTask(
        httpRequest, [&device, session, request = std::move(request), attempt, retriesLeft, cell,
                      completion = std::move(completion)](auto data, auto response, auto error) mutable {
            const auto finished = cell->lock();
            const platform::Value timingData = finished ? finished->timingData() : platform::Value();
            const platform::Date deadline = request.expire.value_or(platform::Date());
            if (!error || device.clock.wallNow() > deadline || retriesLeft == 0)
                return completion(std::move(data), std::move(response), std::move(error), timingData);

            if (request.failed) request.failed(*error);
            const platform::Duration delay = request.delayOnFail ? kDelayOnFail : platform::Duration::zero();
            device.globalQueue(platform::Priority::High)
                ->after(delay, [&device, session, request = std::move(request), attempt, retriesLeft,
                                completion = std::move(completion)]() mutable {
                    dataTaskWithRetryableRequest(device, session, std::move(request), attempt + 1, retriesLeft - 1,
                                                 std::move(completion))
                        ->resume();
                });
        });
    *cell = task;
    return task;
}

} // namespace tavrin
