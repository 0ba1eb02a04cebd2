#pragma once

#include <atomic>
#include <future>
#include <memory>
#include <optional>
#include <string>
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
    [[nodiscard]] std::string why() const { return error ? error->description() : ""; }
};

/// One task and what becomes of it.
class Load {
public:
    /// A data task; a transfer if there are files.
    Load(UrlSession& session, UrlRequest request, std::shared_ptr<Queue> queue,
         std::optional<TransferFiles> files = std::nullopt);

    /// Throws if the task doesn't end within 30 s.
    Outcome wait();
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

/// Tests of the real loader: a session for each load, and a worker pool for the completions.
struct UrlLoads : testing::Test {
    UrlLoads();

    std::unique_ptr<Load> make(UrlRequest request, const UrlSessionConfiguration& configuration = {},
                               std::optional<TransferFiles> files = std::nullopt);
    Outcome load(UrlRequest request, const UrlSessionConfiguration& configuration = {},
                 std::optional<TransferFiles> files = std::nullopt);
    Outcome load(const Url& url, const UrlSessionConfiguration& configuration = {});
    /// Resumes and cancels `count` loads from two threads at a time, ends the loader, and expects each to have ended
    /// once. Returns their codes.
    std::vector<std::int64_t> raceWithCancel(const UrlSessionConfiguration& configuration, int count,
                                             const std::function<Url(int)>& url);
    /// A certificate for servers on loopback; its file is what clients must trust.
    static const tavrin::tools::CertificateFiles& certificate();

    ManualClock clock;
    WorkerPool pool{2};
    std::shared_ptr<Queue> queue = Queue::make("test.delegate", Queue::Kind::Serial, pool, clock);
    std::unique_ptr<UrlLoader> loader = makeCurlLoader(pool, clock);
};

} // namespace platform::test
