#include "platform/net/UrlSessionCurl.h"

#include <arpa/inet.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <thread>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/net/UrlRedirect.h"
#include "platform/net/UrlSession.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestHttpServer.h"
#include "tests/support/UrlLoads.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::always;
using test::byPath;
using test::httpAnswer;
using test::Load;
using test::Outcome;
using test::TestHttpServer;
using Then = TestHttpServer::Then;
using Answer = TestHttpServer::Answer;
using CurlLoaderTest = test::UrlLoads;

/// "hello" as a gzip stream with one stored block.
const std::string kGzipHello("\x1f\x8b\x08\0\0\0\0\0\0\xff\x01\x05\0\xfa\xffhello\x86\xa6\x10\x36\x05\0\0\0", 28);
/// The same with and without zlib's header.
const std::string kZlibHello("\x78\x01\x01\x05\0\xfa\xffhello\x06\x2c\x02\x15", 16);
const std::string kDeflateHello("\x01\x05\0\xfa\xffhello", 10);

// ---- answers ----

TEST_F(CurlLoaderTest, AnswersArriveWholeOnTheDelegateQueue)
{
    const std::string nul("a\0b\xff", 4);
    const std::string chunked = "HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\n\r\n";
    const struct {
        std::string bytes;
        Then then;
        int status;
        std::string body;
    } cases[]{
        {httpAnswer(200, "hello"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, nul), Then::KeepOpen, 200, nul},
        {"HTTP/1.1 204 No Content\r\n\r\n", Then::KeepOpen, 204, ""},
        {httpAnswer(404, "gone"), Then::KeepOpen, 404, "gone"},
        {httpAnswer(503), Then::KeepOpen, 503, ""},
        {"HTTP/1.0 200 OK\r\n\r\nuntil the end", Then::Close, 200, "until the end"},
        {chunked + "3\r\nhel\r\n2;x=y\r\nlo\r\n0\r\nTrailer: t\r\n\r\n", Then::KeepOpen, 200, "hello"},
        {"HTTP/1.1 103 Early Hints\r\nLink: </x>\r\n\r\n" + httpAnswer(200, "late"), Then::KeepOpen, 200, "late"},
        {httpAnswer(200, kGzipHello, "Content-Encoding: gzip\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, kGzipHello + kGzipHello, "Content-Encoding: x-gzip\r\n"), Then::KeepOpen, 200, "hellohello"},
        {httpAnswer(200, kGzipHello + "padding", "Content-Encoding: gzip\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, kZlibHello, "Content-Encoding: deflate\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, kDeflateHello, "Content-Encoding: Deflate\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, "hello", "Content-Encoding: utf-8\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, kGzipHello, "Content-Encoding: gzip, rot13\r\n"), Then::KeepOpen, 200, "hello"},
        {httpAnswer(200, "", "Content-Encoding: gzip\r\n"), Then::KeepOpen, 200, ""},
    };
    for (const auto& c : cases) {
        TestHttpServer server(always({c.bytes, c.then}));
        const Outcome outcome = load(server.url("/a?b=c"));
        ASSERT_FALSE(outcome.error) << c.bytes << ": " << outcome.error->description();
        EXPECT_EQ(outcome.status(), c.status);
        EXPECT_EQ(outcome.body(), c.body);
        EXPECT_TRUE(outcome.response->isHttp);
        EXPECT_EQ(outcome.response->url, server.url("/a?b=c"));
        EXPECT_TRUE(outcome.onDelegateQueue);
        EXPECT_EQ(outcome.response->headers.find("Link"), nullptr) << "a field of the interim answer";
    }
}

TEST_F(CurlLoaderTest, HeaderFieldsAreTrimmedAndKeepTheirOrder)
{
    TestHttpServer server(always({httpAnswer(200, "", "X-A:  one \t\r\nx-a: two\r\nEmpty:\r\nETag: \"a:b\"\r\n")}));
    const Outcome outcome = load(server.url());
    ASSERT_TRUE(outcome.response) << outcome.error.value_or(Error()).description();
    std::string fields;
    for (const auto& [name, value] : outcome.response->headers) fields += name + "=" + value + "\n";
    EXPECT_EQ(fields, "X-A=one\nx-a=two\nEmpty=\nETag=\"a:b\"\nContent-Length=0\n");
    EXPECT_EQ(outcome.response->headers.find("x-A"), &outcome.response->headers.begin()->second);

    TestHttpServer trailing(always({"HTTP/1.1 200 OK\r\nTransfer-Encoding: chunked\r\nTrailer: Cache-Control\r\n\r\n"
                                    "1\r\na\r\n0\r\nCache-Control: max-age=1000\r\n\r\n"}));
    const Outcome trailed = load(trailing.url());
    EXPECT_EQ(trailed.body(), "a");
    EXPECT_FALSE(trailed.response->headers.find("Cache-Control")) << "what comes behind the body";
}

TEST_F(CurlLoaderTest, RequestsGoOutAsAsked)
{
    const struct {
        std::string method, body;
    } cases[]{{"GET", ""},    {"GET", "a body"}, {"POST", ""}, {"POST", "posted"},
              {"PUT", "put"}, {"DELETE", ""},    {"HEAD", ""}};
    TestHttpServer server([](const TestHttpServer::Request& request) {
        std::string answer = httpAnswer(200, "body", "Set-Cookie: a=b\r\n");
        if (request.method == "HEAD") answer.resize(answer.size() - 4);
        return Answer{answer};
    });
    for (const auto& c : cases) {
        const HttpHeaders headers{{"X-One", "a b"}, {"X-Empty", ""}, {"X-Bad", "1\r\nX-Injected: 1"}};
        const Outcome outcome = load(
            UrlRequest{.url = server.url("/p?q=%20+"), .method = c.method, .headers = headers, .body = Bytes(c.body)});
        EXPECT_EQ(outcome.code(), 0) << c.method;
        const auto seen = server.requests().back();
        EXPECT_EQ(seen.method, c.method);
        EXPECT_EQ(seen.target, "/p?q=%20+");
        EXPECT_EQ(seen.body, c.body) << c.method;
        EXPECT_EQ(seen.header("X-One"), "a b");
        EXPECT_TRUE(seen.head.contains("\r\nX-Empty:\r\n"));
        EXPECT_FALSE(seen.head.contains("X-Injected")) << "a line end in a value must not make a field";
        EXPECT_FALSE(seen.head.contains("Cookie")) << "cookies aren't kept";
        EXPECT_FALSE(seen.head.contains("Expect")) << "a round trip for nothing";
        EXPECT_FALSE(seen.head.contains("Content-Type")) << "a body is no form";
    }
}

// ---- redirects ----

TEST_F(CurlLoaderTest, RedirectsAreFollowedWithinLimits)
{
    const auto to = [](int status, const std::string& location) {
        return Answer{httpAnswer(status, "moved", "X-Hop: 1\r\nLocation: " + location + "\r\n")};
    };
    TestHttpServer other(always({httpAnswer(200, "other")}));
    TestHttpServer server(byPath({{"/end", {httpAnswer(200, "end")}},
                                  {"/one", to(301, "/end")},
                                  {"/two", to(302, "one")},
                                  {"/three", to(307, "./two")},
                                  {"/other", to(308, other.url().string())},
                                  {"/loop", to(302, "/loop")},
                                  {"/file", to(302, "file:///etc/hostname")},
                                  {"/ftp", to(302, "ftp://127.0.0.1/x")},
                                  {"/unknown", to(302, "javascript:1")},
                                  {"/nowhere", {httpAnswer(302, "no location")}},
                                  {"/many", to(300, "/end")}}));
    const struct {
        std::string path;
        unsigned limit;
        std::int64_t code;
        std::string body, finalUrl;
    } cases[]{
        {"/one", 16, 0, "end", server.url("/end").string()},
        {"/three", 16, 0, "end", server.url("/end").string()},
        {"/three", 3, 0, "end", server.url("/end").string()},
        {"/three", 2, kUrlTooManyRedirects, "", ""},
        {"/one", 0, kUrlTooManyRedirects, "", ""},
        {"/loop", 16, kUrlTooManyRedirects, "", ""},
        {"/other", 16, 0, "other", other.url().string()},
        {"/file", 16, kUrlForbiddenRedirect, "", ""},
        {"/ftp", 16, kUrlForbiddenRedirect, "", ""},
        {"/unknown", 16, kUrlForbiddenRedirect, "", ""},
        {"/nowhere", 16, 0, "no location", server.url("/nowhere").string()},
    };
    for (const auto& c : cases) {
        const Outcome outcome = load(server.url(c.path), {.maximumRedirects = c.limit});
        EXPECT_EQ(outcome.code(), c.code) << c.path << (outcome.error ? ": " + outcome.error->description() : "");
        if (c.code != 0) {
            EXPECT_FALSE(outcome.data) << c.path;
            continue;
        }
        EXPECT_EQ(outcome.body(), c.body);
        EXPECT_EQ(outcome.response->url.string(), c.finalUrl);
        EXPECT_EQ(outcome.response->headers.find("X-Hop"), nullptr) << "a field of the redirect";
    }
}

TEST_F(CurlLoaderTest, SeeOtherTurnsAPostIntoAGet)
{
    for (const auto& [status, method] : {std::pair(303, "GET"), {302, "GET"}, {307, "POST"}, {308, "POST"}}) {
        TestHttpServer server(
            byPath({{"/post", {httpAnswer(status, "", "Location: /got\r\n")}}, {"/got", {httpAnswer(200)}}}));
        load(UrlRequest{.url = server.url("/post"), .method = "POST", .body = Bytes("x")});
        EXPECT_EQ(server.requests().back().target, "/got");
        EXPECT_EQ(server.requests().back().method, method) << status;
        EXPECT_EQ(server.requests().back().body, method == std::string("GET") ? "" : "x") << status;
    }
}

TEST_F(CurlLoaderTest, RedirectsAcrossOriginsTellNothingOfTheUser)
{
    TestHttpServer other(always({httpAnswer(200, "other")}));
    const std::string there = other.url("/there").string();
    const std::string withPassword = "http://user:secret@" + there.substr(7);
    TestHttpServer server(byPath({{"/302", {httpAnswer(302, "", "Location: " + there + "\r\n")}},
                                  {"/307", {httpAnswer(307, "", "Location: " + there + "\r\n")}},
                                  {"/user", {httpAnswer(302, "", "Location: " + withPassword + "\r\n")}}}));
    const struct {
        const char *path, *body;
        bool arrives;
    } cases[]{{"/302", "", true},
              {"/302", "events", true},
              {"/307", "", true},
              {"/307", "events", false},
              {"/user", "", true}};
    for (const auto& c : cases) {
        const std::size_t before = other.requests().size();
        const Outcome outcome =
            load(UrlRequest{.url = server.url(c.path),
                            .method = *c.body ? "POST" : "GET",
                            .headers = {{"X-Guid", "1"}, {"Authorization", "2"}, {"Accept-Language", "fr"}},
                            .body = Bytes(c.body)});
        EXPECT_EQ(outcome.code(), c.arrives ? 0 : std::int64_t{kUrlForbiddenRedirect}) << c.path << c.body;
        ASSERT_EQ(other.requests().size(), before + c.arrives) << c.path << c.body;
        if (!c.arrives) continue;
        const auto seen = other.requests().back();
        EXPECT_FALSE(seen.head.contains("X-Guid") || seen.head.contains("Authorization")) << c.path << seen.head;
        EXPECT_EQ(seen.header("Accept-Language"), "fr");
        EXPECT_EQ(seen.body, "");
    }
}

TEST_F(CurlLoaderTest, NothingLeadsFromHttpsToHttp)
{
    TestHttpServer plain(always({httpAnswer(200, "plain")}));
    const test::TemporaryDirectory directory;
    const auto certificate = certificateIn(directory / "certificate");
    TestHttpServer secure(always({httpAnswer(307, "", "Location: " + plain.url().string() + "\r\n")}),
                          {.certificate = certificate});
    const std::string caFile = certificate.certificate;
    EXPECT_EQ(load(secure.url(), {.caFile = caFile}).code(), kUrlForbiddenRedirect);
    const UrlSource fromSecure{.secure = true, .isPublic = false};
    EXPECT_EQ(load(UrlRequest{.url = plain.url(), .source = fromSecure}).code(), kUrlForbiddenRedirect)
        << "as an image";
    EXPECT_TRUE(plain.requests().empty());
}

/// Gives this thread a network of its own, whose loopback interface has a public address too.
bool enterNetworkWithPublicAddress(const char* address)
{
    if (unshare(CLONE_NEWNET) != 0) return false;
    const FileHandle control(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    ifreq request{};
    std::strcpy(request.ifr_name, "lo");
    request.ifr_flags = IFF_UP | IFF_RUNNING | IFF_LOOPBACK;
    if (ioctl(control.fd(), SIOCSIFFLAGS, &request) != 0) return false;
    request = {};
    std::strcpy(request.ifr_name, "lo:1");
    auto* in = reinterpret_cast<sockaddr_in*>(&request.ifr_addr);
    in->sin_family = AF_INET;
    inet_pton(AF_INET, address, &in->sin_addr);
    return ioctl(control.fd(), SIOCSIFADDR, &request) == 0;
}

TEST_F(CurlLoaderTest, PublicHostCannotLeadToAnInnerAddress)
{
    constexpr const char* kPublic = "192.31.196.1"; // of a block without hosts
    bool possible = false;
    // The servers' and the loader's threads are made on this one, and so are in its network.
    std::jthread([&] {
        possible = enterNetworkWithPublicAddress(kPublic);
        if (!possible) return;
        TestHttpServer inner(always({httpAnswer(200, "secret")}));
        const std::string target = inner.url("/secret").string();
        TestHttpServer outer(byPath({{"/in", {httpAnswer(302, "", "Location: " + target + "\r\n")}},
                                     {"/twice", {httpAnswer(302, "", "Location: /in\r\n")}},
                                     {"/around", {httpAnswer(302, "", "Location: /end\r\n")}},
                                     {"/end", {httpAnswer(200, "end")}}}),
                             {.address = kPublic});
        for (const char* path : {"/in", "/twice"}) {
            const Outcome outcome = load(outer.url(path));
            EXPECT_EQ(outcome.code(), kUrlForbiddenRedirect) << path;
            EXPECT_FALSE(outcome.data);
        }
        const Outcome end = load(outer.url("/around"));
        EXPECT_EQ(end.body(), "end");
        const UrlSource source = sourceOf(end.response.value());
        EXPECT_EQ(source, (UrlSource{.secure = false, .isPublic = true}));
        EXPECT_EQ(load(UrlRequest{.url = inner.url(), .source = source}).code(), kUrlForbiddenRedirect)
            << "a URL that the answer names";
        EXPECT_EQ(load(UrlRequest{.url = outer.url("/end"), .source = source}).body(), "end");
        EXPECT_TRUE(inner.requests().empty()) << "nothing must be sent there";
        EXPECT_EQ(load(inner.url()).body(), "secret") << "what is asked for directly is allowed";
    }).join();
    if (!possible) GTEST_SKIP() << "needs the right to make a network namespace";
}

// ---- limits ----

TEST_F(CurlLoaderTest, AnswersBeyondALimitEndInAnError)
{
    const std::string status = "HTTP/1.1 200 OK\r\n";
    std::string manyFields;
    for (int i = 0; i < 1400; ++i) manyFields += fmt::format("X-{}: {}\r\n", i, std::string(200, 'x'));
    const auto chunks = [&](const std::string& body) {
        return fmt::format("{}Transfer-Encoding: chunked\r\n\r\n{:x}\r\n{}\r\n0\r\n\r\n", status, body.size(), body);
    };
    const std::string hundred(100, 'x');
    const struct {
        const char* what;
        std::string bytes;
        std::size_t limit;
        std::int64_t code;
    } cases[]{
        {"body at the limit", httpAnswer(200, hundred), 100, 0},
        {"body above it", httpAnswer(200, hundred + "x"), 100, kUrlTooLarge},
        {"chunks at the limit", chunks(hundred), 100, 0},
        {"chunks above it", chunks(hundred + "x"), 100, kUrlTooLarge},
        {"small on the wire, larger unpacked", httpAnswer(200, kGzipHello, "Content-Encoding: gzip\r\n"), 4,
         kUrlTooLarge},
        {"no body allowed", httpAnswer(200, "x"), 0, kUrlTooLarge},
        {"packed without end, unpacked nothing", httpAnswer(200, kGzipHello + hundred, "Content-Encoding: gzip\r\n"),
         100, kUrlTooLarge},
        {"a length nobody can send", status + "Content-Length: 9223372036854775807\r\n\r\nx", 100, kUrlConnectionLost},
        {"one long field", status + "X: " + std::string(300'000, 'x') + "\r\n\r\n", 100, kUrlConnectionLost},
        {"many fields", httpAnswer(200, "", manyFields), 100, kUrlTooLarge},
    };
    for (const auto& c : cases) {
        TestHttpServer server(always({c.bytes, Then::Close}));
        const Outcome outcome = load(server.url(), {.maximumResponseSize = c.limit});
        EXPECT_EQ(outcome.code(), c.code) << c.what << (outcome.error ? ": " + outcome.error->description() : "");
        EXPECT_EQ(outcome.data.has_value(), c.code == 0) << c.what;
    }
}

TEST_F(CurlLoaderTest, ServersThatHangTimeOut)
{
    const struct {
        const char* what;
        std::string bytes;
        int status;
        Duration timeout; // longer where something must arrive within it
    } cases[]{{"says nothing", "", 0, 50ms},
              {"stops within the fields", "HTTP/1.1 200 OK\r\nX-", 200, 300ms},
              {"stops within the body", "HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhel", 200, 300ms}};
    for (const auto& c : cases) {
        TestHttpServer server(always({c.bytes}));
        for (const bool byRequest : {true, false}) {
            UrlRequest request{.url = server.url()};
            UrlSessionConfiguration configuration;
            if (byRequest)
                request.timeout = c.timeout;
            else
                configuration.requestTimeout = c.timeout;
            const Outcome outcome = load(std::move(request), configuration);
            EXPECT_EQ(outcome.code(), kUrlTimedOut) << c.what;
            EXPECT_EQ(outcome.status(), c.status) << c.what;
            EXPECT_FALSE(outcome.data) << c.what;
        }
    }
}

// However steadily it receives.
TEST_F(CurlLoaderTest, LoadsAreLimitedInTimeInAll)
{
    TestHttpServer server(always({"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhel"}));
    const Outcome outcome = load(server.url(), {.requestTimeout = 20s, .totalTimeout = 100ms});
    EXPECT_EQ(outcome.code(), kUrlTimedOut);
    EXPECT_EQ(outcome.error.value_or(Error()).reason(), "not whole after 0.1 s");
}

// One task that hangs must hold back neither the others nor their time-outs.
TEST_F(CurlLoaderTest, TimeOutsAreCountedPerTask)
{
    TestHttpServer server(byPath({{"/hang", {""}}, {"/end", {httpAnswer(200, "end")}}}));
    const auto patient = make({.url = server.url("/hang")});
    const auto hasty = make({.url = server.url("/hang"), .timeout = 50ms});
    patient->task->resume();
    hasty->task->resume();
    EXPECT_EQ(load(server.url("/end")).body(), "end");
    EXPECT_EQ(hasty->wait().code(), kUrlTimedOut);
    EXPECT_EQ(patient->completions(), 0);
    patient->task->cancel();
    EXPECT_EQ(patient->wait().code(), kUrlCancelled);
}

// ---- faults ----

TEST_F(CurlLoaderTest, BrokenAnswersAreErrors)
{
    const std::string head = "HTTP/1.1 200 OK\r\n";
    const std::string chunked = head + "Transfer-Encoding: chunked\r\n\r\n";
    const struct {
        const char* what;
        Answer answer;
        std::int64_t code;
    } cases[]{
        {"closed before an answer", {"", Then::Close}, kUrlConnectionLost},
        {"reset before an answer", {"", Then::Reset}, kUrlConnectionLost},
        {"cut within the body", {head + "Content-Length: 9\r\n\r\nhel", Then::Close}, kUrlConnectionLost},
        {"reset within the body", {head + "Content-Length: 9\r\n\r\nhel", Then::Reset}, kUrlConnectionLost},
        {"cut between chunks", {chunked + "3\r\nhel\r\n", Then::Close}, kUrlConnectionLost},
        {"no chunk length", {chunked + "zz\r\nhel\r\n", Then::Close}, kUrlConnectionLost},
        {"not HTTP", {"SSH-2.0-x\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"no status", {"HTTP/1.1 abc\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"a field without colon", {head + "No colon\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"two lengths", {head + "Content-Length: 1\r\nContent-Length: nine\r\n\r\nx", Then::Close}, kUrlBadResponse},
        {"not gzip", {httpAnswer(200, "hello", "Content-Encoding: gzip\r\n"), Then::KeepOpen}, kUrlBadResponse},
        {"gzip that ends early",
         {httpAnswer(200, kGzipHello.substr(0, 18), "Content-Encoding: gzip\r\n"), Then::KeepOpen},
         kUrlBadResponse},
        {"gzip whose second member ends early",
         {httpAnswer(200, kGzipHello + kGzipHello.substr(0, 9), "Content-Encoding: gzip\r\n"), Then::KeepOpen},
         kUrlBadResponse},
        {"deflate that ends early",
         {httpAnswer(200, kDeflateHello.substr(0, 8), "Content-Encoding: deflate\r\n"), Then::KeepOpen},
         kUrlBadResponse},
    };
    for (const auto& c : cases) {
        TestHttpServer server(always(c.answer));
        const Outcome outcome = load(server.url());
        EXPECT_EQ(outcome.code(), c.code) << c.what << (outcome.error ? ": " + outcome.error->description() : "");
        EXPECT_FALSE(outcome.data) << c.what;
        EXPECT_TRUE(outcome.onDelegateQueue);
        EXPECT_NE(outcome.error.value_or(Error()).reason(), "") << c.what;
    }
}

// Over TLS libcurl takes a connection that the server has closed for one that has data, and gives up after five such.
TEST_F(CurlLoaderTest, ConnectionsThatWereClosedFailNoRequest)
{
    const test::TemporaryDirectory directory;
    const auto certificate = certificateIn(directory / "certificate");
    for (const bool tls : {false, true}) {
        TestHttpServer server(byPath({{"/wait", {""}}, {"/end", {httpAnswer(200, "end")}}}),
                              {.certificate = tls ? std::optional(certificate) : std::nullopt});
        const UrlSessionConfiguration configuration{.caFile = certificate.certificate};
        for (const char* method : {"GET", "POST"}) {
            std::vector<std::unique_ptr<Load>> together;
            for (int i = 0; i < 8; ++i) together.push_back(make({.url = server.url("/wait")}, configuration));
            const std::size_t before = server.requests().size();
            for (const auto& one : together) one->task->resume();
            server.waitForRequests(before + together.size());
            server.sendToAll({httpAnswer(200, "all")});
            for (const auto& one : together) EXPECT_EQ(one->wait().body(), "all");
            server.sendToAll({"", Then::Close});
            const Outcome outcome = load(
                UrlRequest{.url = server.url("/end"), .method = method, .body = Bytes(*method == 'P' ? "sent" : "")},
                configuration);
            EXPECT_EQ(outcome.body(), "end") << outcome.error.value_or(Error()).description();
            EXPECT_EQ(server.requests().back().body, *method == 'P' ? "sent" : "");
        }
    }
}

TEST_F(CurlLoaderTest, ARequestThatWasAnsweredIsNotRepeated)
{
    TestHttpServer server(byPath({{"/end", {httpAnswer(200, "end")}},
                                  {"/cut", {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhel", Then::Close}},
                                  {"/dead", {"", Then::Close}}}));
    load(server.url("/end"));
    EXPECT_EQ(load(server.url("/cut")).code(), kUrlConnectionLost);
    EXPECT_EQ(server.requests().size(), 2u) << "the answer had begun";
    load(server.url("/end"));
    EXPECT_EQ(load(server.url("/dead")).code(), kUrlConnectionLost);
    EXPECT_LE(server.requests().size(), 3u + 2u + 1u) << "twice by libcurl, once by us";
}

TEST_F(CurlLoaderTest, SlowAnswersHoldNoOtherRequestBack)
{
    const test::TemporaryDirectory directory;
    const auto certificate = certificateIn(directory / "certificate");
    for (const bool tls : {false, true}) {
        TestHttpServer server(byPath({{"/hang", {""}}, {"/end", {httpAnswer(200, "end")}}}),
                              {.certificate = tls ? std::optional(certificate) : std::nullopt});
        const auto session = loader->makeSession({.pipelining = true, .caFile = certificate.certificate}, queue);
        for (const bool transfers : {false, true}) {
            const auto files = [&] { return transfers ? std::optional<TransferFiles>(TransferFiles()) : std::nullopt; };
            Load slow(*session, {.url = server.url("/hang")}, queue, files());
            Load quick(*session, {.url = server.url("/end")}, queue, files());
            const std::size_t before = server.requests().size();
            slow.task->resume();
            server.waitForRequests(before + 1);
            quick.task->resume();
            EXPECT_EQ(quick.wait().status(), 200);
            EXPECT_EQ(slow.completions(), 0);
            slow.task->cancel();
            slow.wait();
        }
    }
}

TEST_F(CurlLoaderTest, RequestsThatCannotBeSentAreErrors)
{
    std::string closed;
    {
        const TestHttpServer server(always({}));
        closed = server.url().string();
    }
    const struct {
        std::string url;
        std::int64_t code;
    } cases[]{{closed, kUrlCannotConnect},
              {"", kUrlBadUrl},
              {"file:///etc/hostname", kUrlUnsupported},
              {"ftp://127.0.0.1/", kUrlUnsupported},
              {"mailto:a@b", kUrlBadUrl}};
    for (const bool fastOpen : {false, true}) {
        for (const auto& c : cases) {
            const Outcome outcome = load(Url::parse(c.url).value_or(Url()), {.allowFastOpenAndTickets = fastOpen});
            EXPECT_EQ(outcome.code(), c.code) << c.url << ": " << outcome.error.value_or(Error()).description();
            EXPECT_FALSE(outcome.response);
        }
    }
}

TEST_F(CurlLoaderTest, CertificatesAreCheckedAndSessionsResumedWhereAllowed)
{
    const test::TemporaryDirectory directory;
    const auto certificate = certificateIn(directory / "certificate");
    TestHttpServer server(always({httpAnswer(200, "safe"), Then::Close}), {.certificate = certificate});
    EXPECT_EQ(load(server.url()).code(), kUrlTlsFailed) << "nobody vouches for it";

    const std::string caFile = certificate.certificate;
    for (const bool tickets : {false, true}) {
        loader = makeCurlLoader();
        for (const bool second : {false, true}) {
            const Outcome outcome = load(server.url(), {.allowFastOpenAndTickets = tickets, .caFile = caFile});
            EXPECT_EQ(outcome.body(), "safe") << outcome.error.value_or(Error()).description();
            EXPECT_EQ(server.requests().back().resumed, tickets && second);
            EXPECT_GT(outcome.timing["_kCFNTimingDataSecureConnectionStart"].asDouble(), 0.0);
        }
    }
}

// ---- cancelling and ending ----

TEST_F(CurlLoaderTest, CancelledTasksCompleteOnceWhenever)
{
    TestHttpServer server(byPath({{"/hang", {""}}, {"/end", {httpAnswer(200, "end")}}}));
    const auto session = loader->makeSession({}, queue);

    Load before(*session, {.url = server.url("/end")}, queue);
    before.task->cancel();
    before.task->resume();
    const Outcome neverSent = before.wait();
    EXPECT_EQ(neverSent.code(), kUrlCancelled);
    EXPECT_TRUE(neverSent.onDelegateQueue);

    Load running(*session, {.url = server.url("/hang")}, queue);
    running.task->resume();
    running.task->resume();
    server.waitForRequests(1);
    running.task->cancel();
    running.task->cancel();
    const Outcome cut = running.wait();
    EXPECT_EQ(cut.code(), kUrlCancelled);
    EXPECT_FALSE(cut.data || cut.response);
    EXPECT_TRUE(cut.timing.isNull());

    Load after(*session, {.url = server.url("/end")}, queue);
    after.task->resume();
    EXPECT_EQ(after.wait().body(), "end");
    after.task->cancel();

    load(server.url("/end")); // the loader's thread has seen all commands by now
    settle();
    EXPECT_EQ(before.completions() + running.completions() + after.completions(), 3);
    for (const auto& request : server.requests()) EXPECT_NE(request.target, "") << "all were whole";
    EXPECT_EQ(server.requests().size(), 3u) << "the first was never sent, the second once";
}

TEST_F(CurlLoaderTest, ACancelThatRacesWithTheRestIsNeverLostOrDoubled)
{
    TestHttpServer server(byPath({{"/hang", {""}}, {"/end", {httpAnswer(200, "end")}}}));
    const auto session = loader->makeSession({.requestTimeout = 20s}, queue);
    std::vector<std::unique_ptr<Load>> loads;
    for (int i = 0; i < 200; ++i)
        loads.push_back(
            std::make_unique<Load>(*session, UrlRequest{.url = server.url(i % 2 ? "/hang" : "/end")}, queue));
    resumeWhileCancelling(loads);
    for (std::size_t i = 0; i < loads.size(); ++i) {
        const auto code = loads[i]->wait().code();
        if (i % 2 || code != 0) {
            EXPECT_EQ(code, kUrlCancelled);
        }
    }
    loader.reset();
    settle();
    for (const auto& one : loads) EXPECT_EQ(one->completions(), 1);
}

TEST_F(CurlLoaderTest, DestroyingTheLoaderCancelsWhatIsUnderWay)
{
    TestHttpServer server(always({""}));
    const auto session = loader->makeSession({}, queue);
    Load sent(*session, {.url = server.url()}, queue);
    Load neverResumed(*session, {.url = server.url()}, queue);
    sent.task->resume();
    server.waitForRequests(1);
    loader.reset();
    EXPECT_EQ(sent.wait().code(), kUrlCancelled);
    settle();
    EXPECT_EQ(neverResumed.completions(), 0);
}

TEST_F(CurlLoaderTest, ATaskMayStartAnotherInItsCompletion)
{
    TestHttpServer server(always({httpAnswer(200, "again")}));
    const auto session = loader->makeSession({}, queue);
    Load second(*session, {.url = server.url()}, queue);
    session->dataTask({.url = server.url()}, [&](auto, auto, auto) { second.task->resume(); })->resume();
    EXPECT_EQ(second.wait().body(), "again");
}

} // namespace
} // namespace platform
