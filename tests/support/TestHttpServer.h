#pragma once

#include <condition_variable>
#include <cstdint>
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

/// An HTTP server on a loopback port whose answers are bytes that the test chooses, sound or not. One thread of its own
/// serves every connection; the test's thread makes and destroys it.
class TestHttpServer {
public:
    struct Request {
        std::string method;
        std::string target; ///< path and query, as sent
        std::string head;   ///< request line and header fields, with their line ends
        std::string body;
        int connection = 0;   ///< which connection it came on, from 1
        bool resumed = false; ///< that connection took up an earlier TLS session

        /// The value of the first field of that name, written as `name` is; empty where there is none.
        [[nodiscard]] std::string header(std::string_view name) const;
    };
    /// What becomes of the connection once the bytes are sent. KeepOpen with an incomplete answer is a server that
    /// hangs.
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
        /// Negotiated over TLS in place of HTTP/1.1. What arrives then goes to the handler as it comes, as a body.
        std::string protocol{};
    };

    explicit TestHttpServer(Handler handler);
    TestHttpServer(Handler handler, const Options& options);
    ~TestHttpServer();

    [[nodiscard]] Url url(std::string_view target = "/") const;
    [[nodiscard]] std::uint16_t port() const;
    [[nodiscard]] int connections() const;
    [[nodiscard]] std::vector<Request> requests() const;
    /// Blocks until `count` requests have been read in all.
    void waitForRequests(std::size_t count);
    /// Sends on every open connection what the handler didn't. Blocks until it is sent.
    void sendToAll(const Answer& answer);

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

/// A whole answer: status line, the fields given, Content-Length and body.
[[nodiscard]] std::string httpAnswer(int status, std::string_view body = {}, std::string_view fields = {});

/// Answers every request with the entry for its target, others with 404.
[[nodiscard]] TestHttpServer::Handler byPath(std::map<std::string, TestHttpServer::Answer> answers);
/// Answers every request alike.
[[nodiscard]] TestHttpServer::Handler always(TestHttpServer::Answer answer);

} // namespace platform::test
