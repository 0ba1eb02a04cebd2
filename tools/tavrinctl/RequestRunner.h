#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "tools/tavrinctl/Results.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin {
struct TAVQueryItem;
struct TAVRequest;
} // namespace tavrin

namespace tavrin::ctl {

/// Sends requests over one configured connection, numbers them and measures their latency. Not thread-safe.
class RequestRunner {
public:
    /// With `showHttp` the HTTP request and response of a verbose reply are shown.
    explicit RequestRunner(const Options& options, bool showHttp = false);

    using Shown = std::function<void(const Exchange&)>;
    /// Sends a request. `answered` is called with the answer from inside one of the waiting calls below.
    std::shared_ptr<Exchange> send(TAVRequest& request, std::string query, Shown answered = {});
    /// Receives answers until `done()`, which is called after each answer and when `descriptor` is readable. Returns
    /// false if the daemon closed the connection.
    [[nodiscard]] bool takeAnswers(const std::function<bool()>& done, int descriptor);
    /// Receives answers for `duration`.
    void pause(std::chrono::duration<double, std::milli> duration);
    /// Receives answers until every request has one. A request without an answer in time gets a `problem`, one that
    /// failed for want of a bag the `cause`.
    void waitForAll();
    /// Sends a request and blocks until its answer or the time-out.
    Exchange run(TAVRequest& request, std::string query);
    /// The same through the endpoint, which serves views that outlive their search.
    Exchange runThroughEndpoint(TAVRequest& request, std::string query);

private:
    void explainMissingBag();

    const Options& _options;
    const bool _showHttp;
    Session _session;
    TAVBagAnswer _bag;
    struct Outstanding {
        std::shared_ptr<Exchange> exchange;
        std::chrono::steady_clock::time_point begin;
    };
    std::vector<Outstanding> _outstanding;
    std::vector<std::shared_ptr<Exchange>> _withoutBag; // answered since the last wait
    std::int64_t _lastQueryId = 0;
};

/// Parses "name=value" texts. Throws `Failure` for a text without a name.
[[nodiscard]] std::vector<std::shared_ptr<TAVQueryItem>> queryItems(const std::vector<std::string>& texts);

/// Prints an exchange. Throws `Failure` if it failed.
void finish(const Options& options, const Exchange& exchange);

} // namespace tavrin::ctl
