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

/// Sends requests over one configured connection, numbers and times them. One thread.
class RequestRunner {
public:
    /// `showHttp`: the HTTP requests and responses of verbose replies are to be shown.
    explicit RequestRunner(const Options& options, bool showHttp = false);

    using Shown = std::function<void(const Exchange&)>;
    /// Sends a request; `answered` is called when its answer is there, inside one of the waiting calls below.
    std::shared_ptr<Exchange> send(TAVRequest& request, std::string query, Shown answered = {});
    /// Takes answers until `done()`, which is asked again after each of them, and whenever `descriptor` can be read.
    /// False: the daemon closed the connection.
    [[nodiscard]] bool takeAnswers(const std::function<bool()>& done, int descriptor);
    /// Takes answers for a while.
    void pause(std::chrono::duration<double, std::milli> duration);
    /// Takes answers until every request has one; those without one in time say so.
    void waitForAll();
    /// Sends a request and waits for its answer.
    Exchange run(TAVRequest& request, std::string query);
    /// The same through the endpoint, as views do that outlive the search.
    Exchange runThroughEndpoint(TAVRequest& request, std::string query);

private:
    const Options& _options;
    const bool _showHttp;
    Session _session;
    TAVBagAnswer _bag;
    std::vector<std::shared_ptr<Exchange>> _outstanding;
    std::int64_t _lastQueryId = 0;
};

/// "name=value" texts as query items; a `Failure` for one without a name.
[[nodiscard]] std::vector<std::shared_ptr<TAVQueryItem>> queryItems(const std::vector<std::string>& texts);

/// Shows an exchange as the options say; a `Failure` where it failed.
void finish(const Options& options, const Exchange& exchange);

} // namespace tavrin::ctl
