#include "tavrind/TAVRetryableNetworkRequest.h"

#include "platform/device/Device.h"
#include "platform/run/Clock.h"

namespace tavrin {
namespace {
constexpr platform::Duration kDelayOnFail = std::chrono::milliseconds(1500);
}

std::optional<platform::Duration> delayBeforeRetry(std::optional<platform::Date> expire, bool delayOnFail,
                                                   unsigned retriesLeft, platform::Date now)
{
    if (now > expire.value_or(platform::Date()) || retriesLeft == 0) return std::nullopt;
    return delayOnFail ? kDelayOnFail : platform::Duration::zero();
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
            const auto delay =
                error ? delayBeforeRetry(request.expire, request.delayOnFail, retriesLeft, device.clock.wallNow())
                      : std::nullopt;
            if (!delay) return completion(std::move(data), std::move(response), std::move(error), timingData);

            if (request.failed) request.failed(*error);
            device.globalQueue(platform::Priority::High)
                ->after(*delay, [&device, session, request = std::move(request), attempt, retriesLeft,
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
