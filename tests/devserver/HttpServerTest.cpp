#include "tools/devserver/HttpServer.h"

#include <arpa/inet.h>
#include <future>
#include <netinet/in.h>
#include <sys/socket.h>

#include <gtest/gtest.h>

#include "tools/devserver/Gate.h"

namespace devserver {
namespace {

struct HttpServerTest : testing::Test {
    void serve(HttpServer::Handler handler)
    {
        port = server.bind("127.0.0.1", 0).value();
        server.start(std::move(handler));
    }
    /// A connection on which the request is sent.
    [[nodiscard]] platform::FileHandle sent(const std::string& request) const
    {
        platform::FileHandle client(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_in address{.sin_family = AF_INET,
                                  .sin_port = htons(static_cast<std::uint16_t>(port)),
                                  .sin_addr = {htonl(INADDR_LOOPBACK)},
                                  .sin_zero = {}};
        EXPECT_EQ(connect(client.fd(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(send(client.fd(), request.data(), request.size(), 0), static_cast<ssize_t>(request.size()));
        return client;
    }
    /// All that comes until the server closes the connection.
    [[nodiscard]] std::string answerTo(const std::string& request) const
    {
        const platform::FileHandle client = sent(request);
        std::string received;
        char buffer[4096];
        for (ssize_t n; (n = recv(client.fd(), buffer, sizeof buffer, 0)) > 0;)
            received.append(buffer, static_cast<std::size_t>(n));
        return received;
    }

    HttpServer server;
    int port = 0;
};

TEST_F(HttpServerTest, TargetsComeAsSentAndARequestWithoutLengthHasNoBody)
{
    Request seen;
    serve([&](const Request& request) {
        seen = request;
        return Answer{.body = "ok"};
    });
    (void)answerTo("POST /feedback?a=%2B&b=%20+c HTTP/1.1\r\nHost: h\r\nConnection: close\r\n\r\n");
    server.stop();
    EXPECT_EQ(seen.query, "a=%2B&b=%20+c");
    EXPECT_EQ(seen.item("b"), "  c");
    EXPECT_EQ(seen.item("c"), std::nullopt);
    EXPECT_EQ(seen.peer, "127.0.0.1");
    EXPECT_FALSE(seen.secure);
}

TEST_F(HttpServerTest, BodiesAreCutPaddedOrGoOn)
{
    serve([](const Request& request) {
        Answer answer{.body = "0123456789"};
        answer.cut = request.path.contains("cut");
        if (request.path.contains("padded")) answer.paddedTo = 200'000;
        if (request.path == "/on")
            answer.more = [left = 2]() mutable { return left-- > 0 ? std::optional<std::string>(" ") : std::nullopt; };
        return answer;
    });
    const std::pair<const char*, std::string> cases[]{
        {"/cut", "01234"},
        {"/padded", "0123456789" + std::string(199'990, ' ')},
        {"/cut-padded", "0123456789" + std::string(99'990, ' ')},
        {"/on", "A\r\n0123456789\r\n1\r\n \r\n1\r\n \r\n"}, // no last chunk
    };
    for (const auto& [path, body] : cases) {
        const std::string answer =
            answerTo(std::string("GET ") + path + " HTTP/1.1\r\nHost: h\r\nConnection: close\r\n\r\n");
        EXPECT_EQ(answer.substr(std::min(answer.find("\r\n\r\n"), answer.size() - 4) + 4), body) << path;
    }
}

TEST_F(HttpServerTest, APeerThatLeavesEndsItsWait)
{
    Gate gate;
    std::promise<void> held;
    std::promise<Gate::Outcome> outcome;
    serve([&](const Request& request) {
        held.set_value();
        outcome.set_value(gate.wait(std::nullopt, request.connection));
        return Answer{.body = "ok"};
    });
    {
        const auto client = sent("GET / HTTP/1.1\r\nHost: h\r\n\r\n");
        held.get_future().wait();
    }
    EXPECT_EQ(outcome.get_future().get(), Gate::Outcome::PeerGone);
}

} // namespace
} // namespace devserver
