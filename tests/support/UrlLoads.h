#pragma once

#include <atomic>
#include <barrier>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <future>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCurl.h"
#include "platform/run/Queue.h"
#include "platform/run/WorkerPool.h"
#include "tests/support/ManualClock.h"
#include "tools/shared/Certificate.h"

namespace platform::test {

/// How a task ended.
struct Outcome {
    std::optional<Bytes> data;
    std::optional<UrlResponse> response;
    std::optional<Error> error;
    Value timing;
    bool onDelegateQueue = false;

    [[nodiscard]] std::int64_t code() const { return error ? error->code : 0; }
    [[nodiscard]] int status() const { return response ? response->statusCode : 0; }
    [[nodiscard]] std::string body() const { return data ? std::string(data->view()) : "(none)"; }
};

/// One task and what becomes of it.
class Load {
public:
    /// A data task; a transfer if there are files.
    Load(UrlSession& session, UrlRequest request, std::shared_ptr<Queue> queue,
         std::optional<TransferFiles> files = std::nullopt)
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

    Outcome wait()
    {
        auto outcome = _state->outcome.get_future();
        if (outcome.wait_for(std::chrono::seconds(30)) != std::future_status::ready)
            throw std::runtime_error("the task never completed");
        return outcome.get();
    }
    [[nodiscard]] int completions() const { return _state->completions; }

    std::shared_ptr<UrlTask> task;

private:
    struct State {
        std::promise<Outcome> outcome;
        std::atomic<int> completions = 0;
        std::weak_ptr<UrlTask> task;
    };
    std::shared_ptr<State> _state = std::make_shared<State>();
};

/// Resumes and cancels each of them from two threads at a time.
inline void resumeWhileCancelling(const std::vector<std::unique_ptr<Load>>& loads)
{
    std::barrier together(2);
    const auto each = [&](void (UrlTask::*call)()) {
        for (const auto& one : loads) {
            together.arrive_and_wait();
            (*one->task.*call)();
        }
    };
    std::jthread resuming(each, &UrlTask::resume);
    std::jthread cancelling(each, &UrlTask::cancel);
}

/// Tests of the real loader: a session for each load, and a worker pool for the completions.
struct UrlLoads : testing::Test {
    static void SetUpTestSuite() { setenv("no_proxy", "*", 1); } // whatever proxy the environment has

    std::unique_ptr<Load> make(UrlRequest request, const UrlSessionConfiguration& configuration = {})
    {
        auto session = loader->makeSession(configuration, queue);
        return std::make_unique<Load>(*session, std::move(request), queue);
    }
    Outcome load(UrlRequest request, const UrlSessionConfiguration& configuration = {})
    {
        const auto made = make(std::move(request), configuration);
        made->task->resume();
        return made->wait();
    }
    Outcome load(const Url& url, const UrlSessionConfiguration& configuration = {})
    {
        return load(UrlRequest{.url = url}, configuration);
    }
    /// A certificate for servers on loopback, made in `directory`; its file is what clients must trust.
    static tavrin::tools::CertificateFiles certificateIn(const std::filesystem::path& directory)
    {
        return tavrin::tools::provideCertificate(directory, "127.0.0.1", std::chrono::system_clock::now()).value();
    }
    /// Lets every completion that is due run.
    void settle()
    {
        queue->sync([] {});
    }

    ManualClock clock;
    WorkerPool pool{2};
    std::shared_ptr<Queue> queue = Queue::make("test.delegate", Queue::Kind::Serial, pool, clock);
    std::unique_ptr<UrlLoader> loader = makeCurlLoader();
};

} // namespace platform::test
