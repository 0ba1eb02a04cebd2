#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "tools/devserver/Bag.h"
#include "tools/devserver/Catalogue.h"
#include "tools/devserver/Faults.h"
#include "tools/devserver/Gate.h"
#include "tools/devserver/Http.h"
#include "tools/devserver/RequestLog.h"
#include "tools/devserver/SearchAnswers.h"
#include "tools/devserver/Uploads.h"

namespace devserver {

/// The search service, without sockets. Any thread.
class Service {
public:
    /// `base` is the service's own HTTPS address, "https://127.0.0.1:8443".
    explicit Service(const std::string& base);

    /// Serves a request. Blocks as long as its faults demand.
    [[nodiscard]] Answer answer(const Request& request);
    /// Ends all current and later delays.
    void stop()
    {
        gate.close();
        streams.close();
    }

    static constexpr std::uint64_t kDefaultMaxAge = 60;

    // Read and changed by control calls.
    const std::string base;
    const Catalogue catalogue;
    Bag bag;
    Faults faults;
    RequestLog log;
    Uploads uploads;
    Gate gate;
    Gate streams; ///< ends event streams; control calls don't release it
    std::atomic<int> streamCount = 0;
    std::atomic<std::uint64_t> maxAge = kDefaultMaxAge; ///< seconds; "max_age" of result sets
    /// Called with a line about every upload. Set it before the first request.
    std::function<void(const std::string&)> onUpload;

private:
    [[nodiscard]] Answer answerLogged(std::string_view endpoint, const Request& request,
                                      const std::vector<Fault>& wanted);
    [[nodiscard]] Answer answerEndpoint(std::string_view endpoint, const Request& request);
    [[nodiscard]] Answer answerSearch(std::string_view endpoint, const Request& request);

    SearchAnswers _answers;
    std::atomic<std::uint64_t> _searches = 0;
};

/// Returns the name of the request's endpoint; "unknown" if it isn't served.
[[nodiscard]] std::string_view endpointOf(const Request& request);

} // namespace devserver
