#include <atomic>
#include <fcntl.h>

#include <gtest/gtest.h>

#include "platform/files/Files.h"
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
        return load(std::move(request), configuration, std::move(files));
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
        {httpAnswer(304), Then::KeepOpen, 0, ""},
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
        EXPECT_EQ(outcome.code(), c.code) << c.answer.substr(0, 80) << outcome.why();
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
        EXPECT_EQ(outcome.status(), 200) << c.path << outcome.why();
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
    for (const auto& c : cases) {
        std::atomic<bool> answered = false;
        std::atomic<bool> http2 = false;
        const auto serve = [&](const TestHttpServer::Request& request) -> TestHttpServer::Answer {
            if (answered.exchange(true)) return {};
            http2 = request.body.starts_with("PRI ");
            return c.answer;
        };
        TestHttpServer server(serve, {.certificate = certificate(), .anyProtocol = true});
        const Outcome outcome = transfer({.url = server.url(), .method = "POST"}, {.upload = fileOf(big)},
                                         {.requestTimeout = 300ms, .caFile = certificate().certificate});
        EXPECT_EQ(outcome.status(), c.expected) << c.what;
        EXPECT_EQ(outcome.error.has_value(), c.expected == 0) << c.what << ": " << outcome.why();
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

} // namespace
} // namespace platform
