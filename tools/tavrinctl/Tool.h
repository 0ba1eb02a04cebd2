#pragma once

#include <functional>
#include <memory>
#include <stdexcept>
#include <string>

#include "CoreTavrin/TAVClient.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/values/Value.h"

namespace tavrin::ctl {

/// What ends a command: a text for the user, which says what to do next, and the exit status.
class Failure : public std::runtime_error {
public:
    explicit Failure(const std::string& message, int status_ = 1) : std::runtime_error(message), status(status_) {}
    int status;
};

/// The options that all commands take.
struct Options {
    bool json = false;
    std::string address = TAVClient::defaultAddress();
    std::string identifier = "com.quorvane.tavrinctl";
    std::string agent = "tavrinctl/1";
    double timeout = 30;    ///< seconds
    std::size_t limit = 10; ///< results of an answer that are listed; 0 is all
};

/// A connection to the daemon, or a `Failure`.
[[nodiscard]] std::unique_ptr<TAVClient> connect(const Options& options);

/// A connection that has introduced itself.
struct Session {
    std::unique_ptr<TAVClient> client;
    TAVSessionConfiguration configuration;
    std::string endpoint;
};
[[nodiscard]] Session openSession(const Options& options);

/// The value of a call, or a `Failure` with its error.
template <class T> [[nodiscard]] T valueOf(platform::Result<T> result)
{
    if (!result)
        throw Failure(result.error().reason().empty() ? result.error().description() : result.error().reason());
    return std::move(*result);
}

/// A file of at most so many bytes, links followed; or a `Failure`.
[[nodiscard]] std::string readFile(const std::string& path, std::size_t maximumSize);

/// Writes a value as JSON with a line end.
void printJson(const platform::Value& value);
/// Writes a line to standard output.
void printLine(const std::string& text);
/// Whether standard output is a terminal that takes colours; NO_COLOR says no.
[[nodiscard]] bool colours();
[[nodiscard]] std::string bold(const std::string& text);
[[nodiscard]] std::string dim(const std::string& text);

/// A text from the service with its control characters replaced, so that it can't drive the terminal.
[[nodiscard]] std::string printable(std::string_view text);

} // namespace tavrin::ctl
