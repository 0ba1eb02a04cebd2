#pragma once

#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "tools/devserver/Http.h"
#include "tools/shared/Certificate.h"

namespace devserver {

/// An HTTP/1.1 server with one listening socket and a thread for each connection.
class HttpServer {
public:
    static constexpr std::size_t kMaximumBody = 16u << 20;

    /// Called for each request, on its connection's thread; may block.
    using Handler = std::function<Answer(const Request&)>;

    /// Without a certificate, serves plain HTTP.
    explicit HttpServer(std::optional<tavrin::tools::CertificateFiles> certificate = {});
    /// Calls `stop`.
    ~HttpServer();

    /// Binds the port (0: any free one) and returns it. The error is "taken" for a port in use, or the system's text.
    std::expected<int, std::string> bind(const std::string& address, int port);
    /// Starts serving. Call it once, after `bind`. Throws if the certificate can't be used.
    void start(Handler handler);
    /// Closes all connections; returns after the last handler has returned.
    void stop();

private:
    struct Implementation;
    std::unique_ptr<Implementation> _implementation;
};

} // namespace devserver
