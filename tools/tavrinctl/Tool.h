#pragma once

#include <memory>
#include <stdexcept>
#include <string>

#include "CoreTavrin/TAVClient.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/values/Value.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Output.h"

namespace tavrin::ctl {

/// Ends a command. Carries a message for the user, which says what to do next, and the exit status.
class Failure : public std::runtime_error {
public:
    explicit Failure(const std::string& message, int status_ = 1) : std::runtime_error(message), status(status_) {}
    int status;
};

/// The options of every command.
struct Options {
    bool json = false;
    std::string address = TAVClient::defaultAddress();
    std::string identifier = "com.quorvane.tavrinctl";
    std::string agent = "tavrinctl/1";
    double timeout = 30;    ///< seconds
    std::size_t limit = 10; ///< maximum number of results to list; 0 lists all
};

/// Connects to the daemon. Throws `Failure` if no daemon answers.
[[nodiscard]] std::unique_ptr<TAVClient> connect(const Options& options);

/// A connection that is configured with the client's identifier and agent.
struct Session {
    std::unique_ptr<TAVClient> client;
    TAVSessionConfiguration configuration;
    std::string endpoint;
};
/// Throws `Failure` if there is no daemon or if it refuses the configuration.
[[nodiscard]] Session openSession(const Options& options);

/// Returns the value of a call. Throws `Failure` with the reason if the call failed.
template <class T> [[nodiscard]] T valueOf(platform::Result<T> result)
{
    if (!result)
        throw Failure(result.error().reason().empty() ? result.error().description() : result.error().reason());
    return std::move(*result);
}

/// Reads a file of at most `maximumSize` bytes and follows links. Throws `Failure` if that fails.
[[nodiscard]] std::string readFile(const std::string& path, std::size_t maximumSize);

using tools::printable;
using tools::printableJson;
/// Returns a text as it can be printed, and the JSON of any other value.
[[nodiscard]] std::string plain(const platform::Value& value);
/// Returns a text as it can be printed, and nothing for any other value.
[[nodiscard]] std::string said(const platform::Value& value);

} // namespace tavrin::ctl
