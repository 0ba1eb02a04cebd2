#include "tests/support/UrlLoads.h"

#include <barrier>
#include <chrono>
#include <cstdlib>
#include <stdexcept>
#include <thread>

#include "tests/support/TemporaryDirectory.h"

namespace platform::test {

Load::Load(UrlSession& session, UrlRequest request, std::shared_ptr<Queue> queue, std::optional<TransferFiles> files)
{
    auto completion = [state = _state, queue = std::move(queue)](auto data, auto response, auto error) {
        if (++state->completions > 1) return;
        const auto finished = state->task.lock();
        state->outcome.set_value({std::move(data), std::move(response), std::move(error),
                                  finished ? finished->timingData() : Value(), queue->isCurrent()});
    };
    task = files ? session.transferTask(std::move(request), std::move(*files), std::move(completion))
                 : session.dataTask(std::move(request), std::move(completion));
    _state->task = task;
}

Outcome Load::wait()
{
    auto outcome = _state->outcome.get_future();
    if (outcome.wait_for(std::chrono::seconds(30)) != std::future_status::ready)
        throw std::runtime_error("the task never completed");
    return outcome.get();
}

UrlLoads::UrlLoads()
{
    setenv("no_proxy", "*", 1); // whatever proxy the environment has
}

std::unique_ptr<Load> UrlLoads::make(UrlRequest request, const UrlSessionConfiguration& configuration,
                                     std::optional<TransferFiles> files)
{
    const auto session = loader->makeSession(configuration, queue);
    return std::make_unique<Load>(*session, std::move(request), queue, std::move(files));
}

Outcome UrlLoads::load(UrlRequest request, const UrlSessionConfiguration& configuration,
                       std::optional<TransferFiles> files)
{
    const auto made = make(std::move(request), configuration, std::move(files));
    made->task->resume();
    return made->wait();
}

Outcome UrlLoads::load(const Url& url, const UrlSessionConfiguration& configuration)
{
    return load(UrlRequest{.url = url}, configuration);
}

std::vector<std::int64_t> UrlLoads::raceWithCancel(const UrlSessionConfiguration& configuration, int count,
                                                   const std::function<Url(int)>& url)
{
    const auto session = loader->makeSession(configuration, queue);
    std::vector<std::unique_ptr<Load>> loads;
    for (int i = 0; i < count; ++i) loads.push_back(std::make_unique<Load>(*session, UrlRequest{.url = url(i)}, queue));
    {
        std::barrier together(2);
        const auto each = [&](void (UrlTask::*call)()) {
            for (const auto& one : loads) {
                together.arrive_and_wait();
                (*one->task.*call)();
            }
        };
        const std::jthread resuming(each, &UrlTask::resume);
        const std::jthread cancelling(each, &UrlTask::cancel);
    }
    std::vector<std::int64_t> codes;
    for (const auto& one : loads) codes.push_back(one->wait().code());
    loader.reset();
    queue->sync([] {}); // every completion has run
    for (const auto& one : loads) EXPECT_EQ(one->completions(), 1);
    return codes;
}

const tavrin::tools::CertificateFiles& UrlLoads::certificate()
{
    static const TemporaryDirectory directory;
    static const auto files =
        tavrin::tools::provideCertificate(directory / "certificate", "127.0.0.1", std::chrono::system_clock::now())
            .value();
    return files;
}

} // namespace platform::test
