#include "tools/devserver/HttpServer.h"

#include <arpa/inet.h>
#include <future>
#include <netinet/in.h>
#include <sys/socket.h>
#include <thread>

#include <gtest/gtest.h>

#include "tools/devserver/Gate.h"

namespace devserver {
namespace {

platform::FileHandle connectTo(int port)
{
    platform::FileHandle client(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(static_cast<std::uint16_t>(port));
    inet_pton(AF_INET, "127.0.0.1", &address.sin_addr);
    EXPECT_EQ(connect(client.fd(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    return client;
}

/// Sends a request and returns all that comes until the server closes the connection.
std::string roundTrip(int port, const std::string& request)
{
    const platform::FileHandle client = connectTo(port);
    EXPECT_EQ(send(client.fd(), request.data(), request.size(), 0), static_cast<ssize_t>(request.size()));
    std::string received;
    char buffer[4096];
    for (ssize_t n; (n = recv(client.fd(), buffer, sizeof buffer, 0)) > 0;)
        received.append(buffer, static_cast<std::size_t>(n));
    return received;
}

std::string bodyOf(const std::string& response)
{
    const std::size_t end = response.find("\r\n\r\n");
    return end == response.npos ? "" : response.substr(end + 4);
}

TEST(HttpServer, RequestsComeAsTheyWereSent)
{
    HttpServer server;
    const int port = server.bind("127.0.0.1", 0).value();
    std::vector<Request> seen;
    server.start([&](const Request& request) {
        seen.push_back(request);
        return Answer{.body = "ok"};
    });
    const std::string packed("\x4b\x04\x00", 3);
    roundTrip(port,
              "POST /feedback?a=%2B&b=%20+c HTTP/1.1\r\nHost: h\r\nConnection: close\r\nContent-Encoding: deflate\r\n"
              "Content-Length: 3\r\n\r\n" +
                  packed);
    // No length and no encoding: no body, and no waiting for one.
    roundTrip(port, "POST /control/reset HTTP/1.1\r\nHost: h\r\nConnection: close\r\n\r\n");
    server.stop();
    ASSERT_EQ(seen.size(), 2u);
    EXPECT_EQ(seen[0].path, "/feedback");
    EXPECT_EQ(seen[0].query, "a=%2B&b=%20+c");
    EXPECT_EQ(seen[0].item("a"), "+");
    EXPECT_EQ(seen[0].item("b"), "  c");
    EXPECT_EQ(seen[0].item("c"), std::nullopt);
    EXPECT_EQ(seen[0].body, packed) << "raw DEFLATE is left packed";
    ASSERT_TRUE(findHeader(seen[0].headers, "content-encoding"));
    EXPECT_EQ(*findHeader(seen[0].headers, "content-encoding"), "deflate");
    EXPECT_EQ(seen[0].peer, "127.0.0.1");
    EXPECT_GE(seen[0].connection, 0);
    EXPECT_FALSE(seen[0].secure);
    EXPECT_EQ(seen[1].body, "");
}

TEST(HttpServer, BodiesAreCutAndPadded)
{
    HttpServer server;
    const int port = server.bind("127.0.0.1", 0).value();
    server.start([&](const Request& request) {
        Answer answer{.body = "0123456789"};
        answer.cut = request.path.starts_with("/cut");
        if (request.path.ends_with("padded")) answer.paddedTo = 200'000;
        return answer;
    });
    const auto get = [&](const std::string& path) {
        return roundTrip(port, "GET " + path + " HTTP/1.1\r\nHost: h\r\nConnection: close\r\n\r\n");
    };
    EXPECT_EQ(bodyOf(get("/whole")), "0123456789");
    const std::string cut = get("/cut");
    EXPECT_NE(cut.find("Content-Length: 10\r\n"), std::string::npos);
    EXPECT_EQ(bodyOf(cut), "01234");
    EXPECT_EQ(bodyOf(get("/padded")), "0123456789" + std::string(199'990, ' '));
    EXPECT_EQ(bodyOf(get("/cut-padded")).size(), 100'000u);
}

TEST(HttpServer, ABodyWithoutAnEndIsCutWhereItStops)
{
    HttpServer server;
    const int port = server.bind("127.0.0.1", 0).value();
    server.start([](const Request&) {
        return Answer{.body = "012345678", .goesOn = [left = 3]() mutable { return left-- > 0; }};
    });
    const std::string response = roundTrip(port, "GET / HTTP/1.1\r\nHost: h\r\n\r\n"); // until the connection's end
    EXPECT_NE(response.find("Transfer-Encoding: chunked"), std::string::npos);
    EXPECT_EQ(bodyOf(response), "9\r\n012345678\r\n1\r\n \r\n1\r\n \r\n1\r\n \r\n") << "no last chunk";
}

TEST(HttpServer, ATakenPortIsAnError)
{
    HttpServer first;
    const int port = first.bind("127.0.0.1", 0).value();
    HttpServer second;
    EXPECT_EQ(second.bind("127.0.0.1", port), std::unexpected(std::string("taken")));
}

TEST(HttpServer, APeerThatLeavesEndsItsWait)
{
    Gate gate;
    std::promise<void> held;
    std::promise<Gate::Outcome> outcome;
    HttpServer server;
    const int port = server.bind("127.0.0.1", 0).value();
    server.start([&](const Request& request) {
        held.set_value();
        outcome.set_value(gate.wait(std::nullopt, request.connection));
        return Answer{.body = "ok"};
    });
    {
        const platform::FileHandle client = connectTo(port);
        const std::string request = "GET / HTTP/1.1\r\nHost: h\r\n\r\n";
        send(client.fd(), request.data(), request.size(), 0);
        held.get_future().wait();
    }
    EXPECT_EQ(outcome.get_future().get(), Gate::Outcome::PeerGone);
}

} // namespace
} // namespace devserver
