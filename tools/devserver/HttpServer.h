#pragma once

#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "tools/devserver/Http.h"
#include "tools/shared/Certificate.h"

namespace devserver {

/// One listening socket and the threads that serve its connections, over HTTP/1.1.
class HttpServer {
public:
    static constexpr std::size_t kMaximumBody = 16u << 20;

    /// Called for each request, on one of the server's threads; several at once.
    using Handler = std::function<Answer(const Request&)>;

    /// Without a certificate plain HTTP.
    explicit HttpServer(std::optional<tavrin::tools::CertificateFiles> certificate = {});
    /// Stops.
    ~HttpServer();

    /// Takes the port (0: any free one) and returns it. The error is a short text: "taken".
    std::expected<int, std::string> bind(const std::string& address, int port);
    /// Serves from here on, on threads of its own. Once, after `bind`.
    void start(Handler handler);
    /// Closes all connections and returns when no handler runs any more.
    void stop();

private:
    struct Implementation;
    std::unique_ptr<Implementation> _implementation;
};

} // namespace devserver
