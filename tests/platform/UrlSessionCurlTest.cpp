#include "platform/net/UrlSessionCurl.h"

#include <arpa/inet.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <thread>

#include <fmt/format.h>
#include <gtest/gtest.h>
#include <zlib.h>

#include "platform/net/UrlRedirect.h"
#include "platform/net/UrlSession.h"
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

/// With a server that answers "/end", and on other paths hangs.
struct CurlLoaderTest : test::UrlLoads {
    static Answer answer(const TestHttpServer::Request& request)
    {
        return {request.target == "/end" ? httpAnswer(200, "end") : ""};
    }
    TestHttpServer server{answer};
    TestHttpServer secure{answer, {.certificate = certificate()}};
    const UrlSessionConfiguration trusting{.caFile = certificate().certificate};
};

/// "hello" as a gzip stream with one stored block.
const std::string kGzipHello("\x1f\x8b\x08\0\0\0\0\0\0\xff\x01\x05\0\xfa\xffhello\x86\xa6\x10\x36\x05\0\0\0", 28);
/// The same with and without zlib's header.
const std::string kZlibHello("\x78\x01\x01\x05\0\xfa\xffhello\x06\x2c\x02\x15", 16);
const std::string kDeflateHello("\x01\x05\0\xfa\xffhello", 10);

/// 70 MB of empty blocks of deflate, in 70 kB of deflate.
std::string nothingPackedTwice()
{
    std::string blocks;
    while (blocks.size() < 70'000'000) blocks.append("\0\0\0\xff\xff", 5);
    blocks.append("\1\0\0\xff\xff", 5); // the last one
    uLongf size = compressBound(blocks.size());
    std::string packed(size, '\0');
    EXPECT_EQ(compress(reinterpret_cast<Bytef*>(packed.data()), &size, reinterpret_cast<const Bytef*>(blocks.data()),
                       blocks.size()),
              Z_OK);
    packed.resize(size);
    return packed;
}

// ---- answers ----

TEST_F(CurlLoaderTest, AnswersArriveWholeOrAsAnError)
{
    const std::string nul("a\0b\xff", 4), hundred(100, 'x'), ok = "HTTP/1.1 200 OK\r\n";
    const std::string chunked = ok + "Transfer-Encoding: chunked\r\n\r\n", nine = ok + "Content-Length: 9\r\n\r\nhel";
    const auto coded = [](const char* coding, const std::string& body) {
        return Answer{httpAnswer(200, body, fmt::format("Content-Encoding: {}\r\n", coding))};
    };
    std::string manyFields;
    for (int i = 0; i < 1400; ++i) manyFields += fmt::format("X-{}: {}\r\n", i, hundred + hundred);
    const struct {
        const char* what;
        Answer answer;
        std::int64_t code = 0;
        std::string body = {};
        int status = 200;
        std::size_t limit = 8u << 20;
    } cases[]{
        {"any byte", {httpAnswer(200, nul)}, 0, nul},
        {"no content", {"HTTP/1.1 204 No Content\r\n\r\n"}, 0, "", 204},
        {"a status that is none of ours", {httpAnswer(404, "gone")}, 0, "gone", 404},
        {"no length", {"HTTP/1.0 200 OK\r\n\r\nuntil the end", Then::Close}, 0, "until the end"},
        {"chunks", {chunked + "3\r\nhel\r\n2;x=y\r\nlo\r\n0\r\nTrailer: t\r\n\r\n"}, 0, "hello"},
        {"interim", {"HTTP/1.1 103 Hints\r\nLink: </x>\r\n\r\n" + httpAnswer(200, "late")}, 0, "late"},
        {"gzip", coded("gzip", kGzipHello), 0, "hello"},
        {"two members of gzip", coded("x-gzip", kGzipHello + kGzipHello), 0, "hellohello"},
        {"gzip and padding", coded("gzip", kGzipHello + "padding"), 0, "hello"},
        {"deflate with zlib's header", coded("deflate", kZlibHello), 0, "hello"},
        {"deflate without", coded("Deflate", kDeflateHello), 0, "hello"},
        {"unknown coding", coded("utf-8", "hello"), 0, "hello"},
        {"known and unknown coding", coded("gzip, rot13", kGzipHello), 0, "hello"},
        {"packed nothing", coded("gzip", ""), 0, ""},
        // limits
        {"body at the limit", {httpAnswer(200, hundred)}, 0, hundred, 200, 100},
        {"body above it", {httpAnswer(200, hundred + "x")}, kUrlTooLarge, "", 200, 100},
        {"chunks above it", {chunked + "65\r\n" + hundred + "x\r\n0\r\n\r\n"}, kUrlTooLarge, "", 200, 100},
        {"small on the wire, larger unpacked", coded("gzip", kGzipHello), kUrlTooLarge, "", 200, 4},
        {"no body allowed", {httpAnswer(200, "x")}, kUrlTooLarge, "", 200, 0},
        {"much between two codings", coded("deflate, deflate", nothingPackedTwice()), kUrlBadResponse},
        {"packed without end", coded("gzip", kGzipHello + hundred), kUrlTooLarge, "", 200, 100},
        {"a length nobody can send",
         {ok + "Content-Length: 9223372036854775807\r\n\r\nx", Then::Close},
         kUrlConnectionLost},
        {"one long field", {ok + "X: " + std::string(300'000, 'x') + "\r\n\r\n", Then::Close}, kUrlConnectionLost},
        {"many fields", {httpAnswer(200, "", manyFields)}, kUrlTooLarge},
        // faults
        {"closed before an answer", {"", Then::Close}, kUrlConnectionLost},
        {"reset before an answer", {"", Then::Reset}, kUrlConnectionLost},
        {"cut within the body", {nine, Then::Close}, kUrlConnectionLost},
        {"reset within the body", {nine, Then::Reset}, kUrlConnectionLost},
        {"cut between chunks", {chunked + "3\r\nhel\r\n", Then::Close}, kUrlConnectionLost},
        {"no chunk length", {chunked + "zz\r\nhel\r\n", Then::Close}, kUrlConnectionLost},
        {"not HTTP", {"SSH-2.0-x\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"no status", {"HTTP/1.1 abc\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"a field without colon", {ok + "No colon\r\n\r\n", Then::Close}, kUrlBadResponse},
        {"two lengths", {ok + "Content-Length: 1\r\nContent-Length: nine\r\n\r\nx", Then::Close}, kUrlBadResponse},
        {"not gzip", coded("gzip", "hello"), kUrlBadResponse},
        {"gzip that ends early", coded("gzip", kGzipHello.substr(0, 18)), kUrlBadResponse},
        {"a member of gzip that ends early", coded("gzip", kGzipHello + kGzipHello.substr(0, 9)), kUrlBadResponse},
        {"deflate that ends early", coded("deflate", kDeflateHello.substr(0, 8)), kUrlBadResponse},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        TestHttpServer server(always(c.answer));
        const Outcome outcome = load(server.url("/a?b=c"), {.maximumResponseSize = c.limit});
        EXPECT_EQ(outcome.code(), c.code) << outcome.why();
        EXPECT_TRUE(outcome.onDelegateQueue);
        EXPECT_EQ(outcome.body(), c.code == 0 ? c.body : "(none)");
        if (c.code != 0) {
            EXPECT_NE(outcome.error.value_or(Error()).reason(), "");
            continue;
        }
        EXPECT_EQ(outcome.status(), c.status);
        EXPECT_TRUE(outcome.response->isHttp);
        EXPECT_EQ(outcome.response->url, server.url("/a?b=c"));
        EXPECT_EQ(outcome.response->headers.find("Link"), nullptr) << "a field of the interim answer";
    }
}

TEST_F(CurlLoaderTest, HeaderFieldsAreTrimmedAndKeepTheirOrder)
{
    TestHttpServer server(always({httpAnswer(200, "", "X-A:  one \t\r\nx-a: two\r\nEmpty:\r\nETag: \"a:b\"\r\n")}));
    const Outcome outcome = load(server.url());
    ASSERT_TRUE(outcome.response) << outcome.why();
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
    const std::pair<std::string, std::string> cases[]{
        {"GET", ""}, {"GET", "a body"}, {"POST", ""}, {"POST", "posted"}, {"PUT", "put"}, {"DELETE", ""}, {"HEAD", ""}};
    TestHttpServer server([](const TestHttpServer::Request& request) {
        std::string answer = httpAnswer(200, "body", "Set-Cookie: a=b\r\n");
        if (request.method == "HEAD") answer.resize(answer.size() - 4);
        return Answer{answer};
    });
    for (const auto& [method, body] : cases) {
        const HttpHeaders headers{{"X-One", "a b"}, {"X-Empty", ""}, {"X-Bad", "1\r\nX-Injected: 1"}};
        const Outcome outcome =
            load(UrlRequest{.url = server.url("/p?q=%20+"), .method = method, .headers = headers, .body = Bytes(body)});
        EXPECT_EQ(outcome.code(), 0) << method;
        const auto seen = server.requests().back();
        EXPECT_EQ(seen.method, method);
        EXPECT_EQ(seen.target, "/p?q=%20+");
        EXPECT_EQ(seen.body, body) << method;
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
                                  {"/nowhere", {httpAnswer(302, "no location")}}}));
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
        EXPECT_EQ(outcome.code(), c.code) << c.path << outcome.why();
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
    TestHttpServer redirecting(always({httpAnswer(307, "", "Location: " + plain.url().string() + "\r\n")}),
                               {.certificate = certificate()});
    EXPECT_EQ(load(redirecting.url(), trusting).code(), kUrlForbiddenRedirect);
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
    // The servers' and the pool's threads are made on this one, and so are in its network.
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
        EXPECT_EQ(inner.connections(), 0) << "nobody must knock there";
        EXPECT_EQ(load(inner.url()).body(), "secret") << "what is asked for directly is allowed";
    }).join();
    if (!possible) GTEST_SKIP() << "needs the right to make a network namespace";
}

TEST_F(CurlLoaderTest, TheLargestBodyGivesWayIfAllTakeTooMuch)
{
    const auto unfinished = [](std::size_t size) {
        return fmt::format("HTTP/1.1 200 OK\r\nContent-Length: {}\r\n\r\n{}", size + 1, std::string(size, 'x'));
    };
    TestHttpServer server(byPath({{"/large", {unfinished(13u << 20)}},
                                  {"/smaller", {unfinished(12u << 20)}},
                                  {"/end", {httpAnswer(200, "end")}}}));
    const auto large = make({.url = server.url("/large")}, {.maximumResponseSize = 20u << 20});
    const auto smaller = make({.url = server.url("/smaller")}, {.maximumResponseSize = 20u << 20});
    large->task->resume();
    smaller->task->resume();
    EXPECT_EQ(large->wait().code(), kUrlTooLarge);
    EXPECT_EQ(load(server.url("/end")).body(), "end");
    EXPECT_EQ(smaller->completions(), 0);
    smaller->task->cancel();
    EXPECT_EQ(smaller->wait().code(), kUrlCancelled);
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
    EXPECT_EQ(outcome.error.value_or(Error()).reason(), "not complete after 0.1 s");
}

// One task that hangs must hold back neither the others nor their time-outs.
TEST_F(CurlLoaderTest, TimeOutsAreCountedPerTask)
{
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

// Over TLS libcurl takes a connection that the server has closed for one that has data, and gives up after five such.
TEST_F(CurlLoaderTest, ConnectionsThatWereClosedFailNoRequest)
{
    for (TestHttpServer* each : {&server, &secure}) {
        for (const char* method : {"GET", "POST"}) {
            std::vector<std::unique_ptr<Load>> together;
            for (int i = 0; i < 8; ++i) together.push_back(make({.url = each->url("/wait")}, trusting));
            const std::size_t before = each->requests().size();
            for (const auto& one : together) one->task->resume();
            each->waitForRequests(before + together.size());
            each->sendToAll({httpAnswer(200, "all")});
            for (const auto& one : together) EXPECT_EQ(one->wait().body(), "all");
            each->sendToAll({"", Then::Close});
            const std::string body = *method == 'P' ? "sent" : "";
            const Outcome outcome =
                load(UrlRequest{.url = each->url("/end"), .method = method, .body = Bytes(body)}, trusting);
            EXPECT_EQ(outcome.body(), "end") << outcome.why();
            EXPECT_EQ(each->requests().back().body, body);
        }
    }
}

TEST_F(CurlLoaderTest, ARequestThatWasAnsweredIsNotRepeated)
{
    TestHttpServer breaking(byPath({{"/end", {httpAnswer(200, "end")}},
                                    {"/cut", {"HTTP/1.1 200 OK\r\nContent-Length: 9\r\n\r\nhel", Then::Close}},
                                    {"/dead", {"", Then::Close}}}));
    load(breaking.url("/end"));
    EXPECT_EQ(load(breaking.url("/cut")).code(), kUrlConnectionLost);
    EXPECT_EQ(breaking.requests().size(), 2u) << "the answer had begun";
    load(breaking.url("/end"));
    EXPECT_EQ(load(breaking.url("/dead")).code(), kUrlConnectionLost);
    EXPECT_LE(breaking.requests().size(), 3u + 2u + 1u) << "twice by libcurl, once by us";
}

TEST_F(CurlLoaderTest, SlowAnswersHoldNoOtherRequestBack)
{
    for (TestHttpServer* each : {&server, &secure}) {
        const auto session = loader->makeSession({.pipelining = true, .caFile = certificate().certificate}, queue);
        for (const bool transfers : {false, true}) {
            const auto files = [&] { return transfers ? std::optional<TransferFiles>(TransferFiles()) : std::nullopt; };
            Load slow(*session, {.url = each->url("/hang")}, queue, files());
            Load quick(*session, {.url = each->url("/end")}, queue, files());
            const std::size_t before = each->requests().size();
            slow.task->resume();
            each->waitForRequests(before + 1);
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
    const std::string closed = TestHttpServer(answer).url().string();
    const std::pair<std::string, std::int64_t> cases[]{{closed, kUrlCannotConnect},
                                                       {"", kUrlBadUrl},
                                                       {"file:///etc/hostname", kUrlUnsupported},
                                                       {"ftp://127.0.0.1/", kUrlUnsupported},
                                                       {"mailto:a@b", kUrlBadUrl}};
    for (const bool fastOpen : {false, true}) {
        for (const auto& [url, code] : cases) {
            const Outcome outcome = load(Url::parse(url).value_or(Url()), {.allowFastOpenAndTickets = fastOpen});
            EXPECT_EQ(outcome.code(), code) << url << ": " << outcome.why();
            EXPECT_FALSE(outcome.response);
        }
    }
}

TEST_F(CurlLoaderTest, CertificatesAreCheckedAndSessionsResumedWhereAllowed)
{
    TestHttpServer closing(always({httpAnswer(200, "safe"), Then::Close}), {.certificate = certificate()});
    EXPECT_EQ(load(closing.url()).code(), kUrlTlsFailed) << "nobody vouches for it";
    for (const bool tickets : {false, true}) {
        loader = makeCurlLoader(pool, clock);
        for (const bool second : {false, true}) {
            const Outcome outcome =
                load(closing.url(), {.allowFastOpenAndTickets = tickets, .caFile = certificate().certificate});
            EXPECT_EQ(outcome.body(), "safe") << outcome.why();
            EXPECT_EQ(closing.requests().back().resumed, tickets && second);
            EXPECT_GT(outcome.timing["_kCFNTimingDataSecureConnectionStart"].asDouble(), 0.0);
        }
    }
}

// ---- cancelling and ending ----

TEST_F(CurlLoaderTest, CancelledTasksCompleteOnceWhenever)
{
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

    load(server.url("/end")); // the loader has seen all commands by now
    queue->sync([] {});       // every completion has run
    EXPECT_EQ(before.completions() + running.completions() + after.completions(), 3);
    EXPECT_EQ(server.requests().size(), 3u) << "the first was never sent, the second once";
}

TEST_F(CurlLoaderTest, ACancelThatRacesWithTheRestIsNeverLostOrDoubled)
{
    const auto codes =
        raceWithCancel({.requestTimeout = 20s}, 200, [&](int i) { return server.url(i % 2 ? "/hang" : "/end"); });
    for (std::size_t i = 0; i < codes.size(); ++i)
        EXPECT_TRUE(codes[i] == kUrlCancelled || (i % 2 == 0 && codes[i] == 0)) << i << ": " << codes[i];
}

TEST_F(CurlLoaderTest, DestroyingTheLoaderCancelsWhatIsUnderWay)
{
    const auto session = loader->makeSession({}, queue);
    Load sent(*session, {.url = server.url()}, queue);
    Load neverResumed(*session, {.url = server.url()}, queue);
    sent.task->resume();
    server.waitForRequests(1);
    loader.reset();
    EXPECT_EQ(sent.wait().code(), kUrlCancelled);
    queue->sync([] {}); // every completion has run
    EXPECT_EQ(neverResumed.completions(), 0);
}

TEST_F(CurlLoaderTest, ATaskMayStartAnotherInItsCompletion)
{
    const auto session = loader->makeSession({}, queue);
    Load second(*session, {.url = server.url("/end")}, queue);
    session->dataTask({.url = server.url("/end")}, [&](auto, auto, auto) { second.task->resume(); })->resume();
    EXPECT_EQ(second.wait().body(), "end");
}

} // namespace
} // namespace platform
