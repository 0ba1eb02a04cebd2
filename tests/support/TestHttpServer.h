#pragma once

#include <condition_variable>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "tools/shared/Certificate.h"

namespace platform::test {

/// An HTTP server on a loopback port whose answers are arbitrary bytes, valid HTTP or not. One thread serves all
/// connections. Created, destroyed and called on the test's thread unless noted otherwise.
class TestHttpServer {
public:
    struct Request {
        std::string method;
        std::string target; ///< path and query, as sent
        std::string head;   ///< request line and header fields, with their line ends
        std::string body;
        bool resumed = false; ///< the connection resumed an earlier TLS session

        /// Returns the value of the first field with exactly this name; empty if there is none.
        [[nodiscard]] std::string header(std::string_view name) const;
    };
    /// What to do with the connection after sending the bytes. KeepOpen with an incomplete answer simulates a server
    /// that hangs.
    enum class Then { KeepOpen, Close, Reset };
    struct Answer {
        std::string bytes;
        Then then = Then::KeepOpen;
    };
    /// Runs on the server's thread.
    using Handler = std::function<Answer(const Request&)>;

    struct Options {
        std::string address = "127.0.0.1";                            ///< IPv4 or IPv6
        std::optional<tavrin::tools::CertificateFiles> certificate{}; ///< if set, the server speaks TLS
        /// Over TLS, HTTP/2 is chosen before HTTP/1.1, and what arrives goes to the handler as it comes, as a body.
        bool anyProtocol = false;
    };

    explicit TestHttpServer(Handler handler);
    TestHttpServer(Handler handler, const Options& options);
    ~TestHttpServer();

    [[nodiscard]] Url url(std::string_view target = "/") const;
    [[nodiscard]] int connections() const;
    [[nodiscard]] std::vector<Request> requests() const;
    /// Blocks until `count` requests were received in total.
    void waitForRequests(std::size_t count);
    /// Sends on every open connection what the handler didn't. Blocks until it is sent.
    void sendToAll(const Answer& answer);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

/// Returns a complete answer: status line, `fields`, Content-Length and body.
[[nodiscard]] std::string httpAnswer(int status, std::string_view body = {}, std::string_view fields = {});

/// Answers each request with the entry for its target, or with 404 if there is none.
[[nodiscard]] TestHttpServer::Handler byPath(std::map<std::string, TestHttpServer::Answer> answers);
/// Gives every request the same answer.
[[nodiscard]] TestHttpServer::Handler always(TestHttpServer::Answer answer);

} // namespace platform::test
