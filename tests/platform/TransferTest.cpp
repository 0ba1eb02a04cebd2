#include <atomic>
#include <fcntl.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/net/BackgroundSession.h"
#include "platform/net/NetworkStatus.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestHttpServer.h"
#include "tests/support/UrlLoads.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::always;
using test::byPath;
using test::httpAnswer;
using test::Outcome;
using test::TestHttpServer;
using Then = TestHttpServer::Then;

/// Transfers between files and a server on loopback.
struct TransferTest : test::UrlLoads {
    Outcome transfer(UrlRequest request, TransferFiles files, const UrlSessionConfiguration& configuration = {})
    {
        const auto session = loader->makeSession(configuration, queue);
        std::promise<Outcome> outcome;
        const auto task =
            session->transferTask(std::move(request), std::move(files), [&](auto data, auto response, auto error) {
                outcome.set_value({std::move(data), std::move(response), std::move(error)});
            });
        task->resume();
        return outcome.get_future().get();
    }
    [[nodiscard]] FileHandle fileOf(std::string_view contents, int flags = O_RDWR) const
    {
        test::writeFile(directory / "file", contents);
        return FileHandle(open((directory / "file").c_str(), flags));
    }
    [[nodiscard]] std::string contents() const
    {
        return std::string(makeSystemFiles()->read(directory / "file", SIZE_MAX)->view());
    }
    test::TemporaryDirectory directory;
};

TEST_F(TransferTest, DownloadsGoIntoTheFile)
{
    const std::string big(200'000, 'b');
    const struct {
        std::string answer;
        Then then;
        std::int64_t code;
        std::string contents;
    } cases[]{
        {httpAnswer(200, "resource"), Then::KeepOpen, 0, "resource"},
        {httpAnswer(404, "none"), Then::KeepOpen, 0, "none"},
        {httpAnswer(304), Then::KeepOpen, 0, ""},
        {"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n3\r\nabc\r\n2\r\nde\r\n0\r\n\r\n", Then::KeepOpen, 0,
         "abcde"},
        {httpAnswer(302, "moved", "Location: /end\r\n"), Then::KeepOpen, 0, "end"},
        {httpAnswer(200, big), Then::KeepOpen, 0, big},
        {httpAnswer(200, big + "!"), Then::KeepOpen, kUrlTooLarge, ""},
        {httpAnswer(200, "cut short").substr(0, 50), Then::Close, kUrlConnectionLost, ""},
        {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhang", Then::KeepOpen, kUrlTimedOut, ""},
    };
    for (const auto& c : cases) {
        TestHttpServer server(byPath({{"/", {c.answer, c.then}}, {"/end", {httpAnswer(200, "end")}}}));
        const auto timeout = c.code == kUrlTimedOut ? Duration(50ms) : Duration(60s);
        const Outcome outcome = transfer({.url = server.url()}, {.download = fileOf("")},
                                         {.requestTimeout = timeout, .maximumResponseSize = big.size()});
        EXPECT_EQ(outcome.code(), c.code) << c.answer.substr(0, 80) << outcome.error.value_or(Error()).description();
        EXPECT_TRUE(c.code != 0 || contents() == c.contents) << c.answer.substr(0, 80);
    }
}

TEST_F(TransferTest, UploadsAreSentWholeAlsoWhereTheyAreRedirected)
{
    TestHttpServer server([](const TestHttpServer::Request& request) -> TestHttpServer::Answer {
        if (request.target == "/again") return {httpAnswer(307, "", "Location: /end\r\n")};
        if (request.target == "/other") return {httpAnswer(303, "", "Location: /end\r\n")};
        return {httpAnswer(200, "thanks"), request.target == "/close" ? Then::Close : Then::KeepOpen};
    });
    std::string big(3'000'000, '\0');
    for (std::size_t i = 0; i < big.size(); ++i) big[i] = static_cast<char>(i * 31 >> 3);
    const struct {
        std::string path, method, body, seenMethod;
        bool sent;
    } cases[]{
        {"/end", "POST", "small", "POST", true}, {"/end", "PUT", big, "PUT", true},
        {"/end", "POST", "", "POST", true},      {"/again", "POST", big, "POST", true},
        {"/other", "POST", big, "GET", false},   {"/close", "POST", big, "POST", true},
        {"/end", "POST", big, "POST", true},
    };
    for (const auto& c : cases) {
        std::uint64_t last = 0;
        const auto progress = [&](std::uint64_t sent, std::uint64_t expected) {
            EXPECT_LE(sent, expected);
            last = sent;
        };
        const Outcome outcome =
            transfer({.url = server.url(c.path), .method = c.method}, {.upload = fileOf(c.body), .progress = progress});
        EXPECT_EQ(outcome.status(), 200) << c.path << outcome.error.value_or(Error()).description();
        const auto seen = server.requests().back();
        EXPECT_EQ(seen.method, c.seenMethod) << c.path;
        EXPECT_TRUE(seen.body == (c.sent ? c.body : "")) << c.path << seen.body.size();
        EXPECT_EQ(last, c.body.size()) << c.path;
    }
}

TEST_F(TransferTest, AStatusAnswersAnUploadThatIsNotYetSent)
{
    const std::string big(1'000'000, 'u');
    const struct {
        const char* what;
        TestHttpServer::Answer answer; // to the head of the request
        int expected;
    } cases[]{{"refused", {httpAnswer(403, "no")}, 403},
              {"refused, and the answer hangs", {httpAnswer(403, "no").substr(0, 42)}, 403},
              {"taken early", {httpAnswer(200, "yes")}, 200},
              {"taken early, and the answer hangs", {httpAnswer(200, "yes").substr(0, 42)}, 200},
              {"closed without a status", {"", Then::Close}, 0}};
    const auto certificate = certificateIn(directory / "certificate");
    for (const auto& c : cases) {
        std::atomic<bool> answered = false;
        std::atomic<bool> http2 = false;
        const auto serve = [&](const TestHttpServer::Request& request) -> TestHttpServer::Answer {
            if (answered.exchange(true)) return {};
            http2 = request.body.starts_with("PRI ");
            return c.answer;
        };
        TestHttpServer server(serve, {.certificate = certificate, .anyProtocol = true});
        const Outcome outcome = transfer({.url = server.url(), .method = "POST"}, {.upload = fileOf(big)},
                                         {.requestTimeout = 300ms, .caFile = certificate.certificate});
        EXPECT_EQ(outcome.status(), c.expected) << c.what;
        EXPECT_EQ(outcome.error.has_value(), c.expected == 0)
            << c.what << ": " << outcome.error.value_or(Error()).description();
        EXPECT_FALSE(http2) << "libcurl may lose the status there";
    }
}

TEST_F(TransferTest, FilesThatFailEndTheTransferWithTheirError)
{
    TestHttpServer server(always({httpAnswer(200, "body")}));
    const Outcome unreadable = transfer({.url = server.url(), .method = "POST"}, {.upload = fileOf("x", O_WRONLY)});
    EXPECT_EQ(unreadable.error.value_or(Error()).domain, kPosixErrorDomain);
    EXPECT_EQ(unreadable.code(), EBADF);
    const Outcome full = transfer({.url = server.url()}, {.download = FileHandle(open("/dev/full", O_WRONLY))});
    EXPECT_EQ(full.error.value_or(Error()).domain, kPosixErrorDomain);
    EXPECT_EQ(full.code(), ENOSPC);
}

/// The real session over the real loader, on worker threads.
TEST_F(TransferTest, ABackgroundUploadReachesTheServer)
{
    struct Waiter final : BackgroundSessionDelegate {
        std::promise<std::pair<int, std::int64_t>> ended;
        std::uint64_t sent = 0;
        void taskDidSendBodyData(const std::shared_ptr<BackgroundTask>&, std::uint64_t now, std::uint64_t) override
        {
            sent = now;
        }
        void taskDidComplete(const std::shared_ptr<BackgroundTask>& task, const std::optional<UrlResponse>& response,
                             const std::optional<Error>& error) override
        {
            EXPECT_FALSE(task->timingData().isNull());
            ended.set_value({response ? response->statusCode : 0, error ? error->code : 0});
        }
    };
    TestHttpServer server(always({httpAnswer(201, "ok")}));
    NetworkStatus network;
    network.set({});
    const auto waiter = std::make_shared<Waiter>();
    static const auto files = makeSystemFiles(); // a worker may be the last that holds the session
    const auto sessions = makeBackgroundSessions({.files = *files,
                                                  .loader = *loader,
                                                  .network = network,
                                                  .clock = clock,
                                                  .executor = pool,
                                                  .directory = directory / "transfers",
                                                  .temporary = directory.path});
    const auto session = sessions->make({.identifier = "real"}, waiter, queue);
    const std::string body(500'000, 'x');
    test::writeFile(directory / "file", body);
    auto task = session->uploadTask({.url = server.url("/up"), .method = "POST"}, directory / "file");
    ASSERT_TRUE(task);
    std::filesystem::remove(directory / "file");
    (*task)->resume();
    task->reset();
    EXPECT_EQ(waiter->ended.get_future().get(), std::pair(201, std::int64_t{0}));
    EXPECT_TRUE(server.requests().at(0).body == body);
    EXPECT_EQ(waiter->sent, body.size());
}

} // namespace
} // namespace platform
