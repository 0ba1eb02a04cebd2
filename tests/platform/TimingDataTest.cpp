#include <ranges>
#include <regex>
#include <set>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/net/CurlSupport.h"
#include "platform/net/UrlSessionCurl.h"
#include "platform/values/Dictionary.h"
#include "tests/support/TestHttpServer.h"
#include "tests/support/UrlLoads.h"

namespace platform {
namespace {

using test::always;
using test::byPath;
using test::httpAnswer;
using test::Outcome;
using test::TestHttpServer;
using Then = TestHttpServer::Then;
using TimingDataTest = test::UrlLoads;

double mark(const Value& timing, std::string_view name)
{
    return timing["_kCFNTimingData" + std::string(name)].asDouble().value_or(-1);
}

TEST_F(TimingDataTest, MarksFollowTheOrderOfTheStages)
{
    constexpr const char* kNeverOnReuse[]{"DomainLookupStart", "DomainLookupEnd", "ConnectStart", "ConnectEnd"};
    TestHttpServer there(always({httpAnswer(200, "there")}));
    TestHttpServer server(byPath({{"/here", {httpAnswer(200, "here")}},
                                  {"/to-here", {httpAnswer(302, "", "Location: /here\r\n")}},
                                  {"/to-there", {httpAnswer(302, "", "Location: " + there.url().string() + "\r\n")}}}));
    const struct {
        const char* path;
        bool redirected, reused;
        bool cold; // begins without connections
    } cases[]{{"/here", false, false, true},     {"/here", false, true, false},  {"/to-here", true, true, false},
              {"/to-there", true, false, false}, {"/to-here", true, true, true}, {"/to-there", true, false, true}};
    for (const auto& c : cases) {
        if (c.cold) loader = makeCurlLoader(pool, clock);
        const double before = monotonicSeconds();
        const Value timing = load(server.url(c.path)).timing;
        const double after = monotonicSeconds();
        for (const auto& [key, value] : *timing.asDictionary()) EXPECT_TRUE(key.starts_with("_kCFNTimingData")) << key;

        std::vector<const char*> order{"FetchStart"};
        if (c.redirected) order.insert(order.end(), {"RedirectStart", "RedirectEnd"});
        if (!c.reused) order.insert(order.end(), std::begin(kNeverOnReuse), std::end(kNeverOnReuse));
        order.insert(order.end(), {"RequestStart", "ResponseStart", "ResponseEnd"});
        double last = before;
        for (const char* name : order) {
            EXPECT_GE(mark(timing, name), last - 1e-6) << c.path << ": " << name; // libcurl counts microseconds
            last = mark(timing, name);
        }
        EXPECT_LE(last, after + 1e-6);
        for (const char* name : kNeverOnReuse) EXPECT_EQ(mark(timing, name) == 0.0, c.reused) << c.path << ": " << name;
        EXPECT_EQ(mark(timing, "RedirectEnd") > 0.0, c.redirected) << c.path;
        EXPECT_EQ(mark(timing, "SecureConnectionStart"), 0.0) << "no TLS here";
        EXPECT_EQ(timing["_kCFNTimingDataConnectionReused"], Value(c.reused)) << c.path;
        EXPECT_EQ(timing["_kCFNTimingDataConnectionInterfaceIdentifier"], Value("lo"));
    }
}

TEST_F(TimingDataTest, ALoadThatFailedSaysHowFarItCame)
{
    TestHttpServer server(always({"", Then::Close}));
    const Url closed = TestHttpServer(always({})).url();
    const struct {
        Url url;
        std::set<std::string> marks;
    } cases[]{
        {closed, {"DomainLookupStart", "DomainLookupEnd", "ConnectStart"}},
        {server.url(),
         {"DomainLookupStart", "DomainLookupEnd", "ConnectStart", "ConnectEnd", "RequestStart", "ResponseStart"}},
    };
    for (const auto& c : cases) {
        const Outcome outcome = load(c.url);
        EXPECT_TRUE(outcome.error);
        EXPECT_EQ(outcome.timing["_kCFNTimingDataConnectionReused"], Value(false)) << c.url.string();
        std::set<std::string> marks;
        for (const auto& [key, value] : *outcome.timing.asDictionary())
            if (value.asDouble().value_or(0) != 0) marks.insert(key.substr(15));
        EXPECT_TRUE(marks.erase("FetchStart") == 1 && marks.erase("ResponseEnd") == 1);
        EXPECT_EQ(marks, c.marks) << c.url.string();
    }
}

TEST_F(TimingDataTest, TheDocumentNamesEveryKeyAndTheBytesOfAnAddress)
{
    const auto page = makeSystemFiles()->read(SOURCE_DIR "/docs/timing.md", 1 << 20);
    ASSERT_TRUE(page);
    const std::string text(page->view());
    const auto matches = [&](const std::regex& row) {
        return std::ranges::subrange(std::sregex_iterator(text.begin(), text.end(), row), std::sregex_iterator());
    };
    TestHttpServer server(always({httpAnswer(200)}));
    const Value timing = load(server.url()).timing;
    std::set<std::string> keys, documented;
    for (const auto& [key, value] : *timing.asDictionary()) keys.insert(key);
    const std::regex key(R"(\| `(_kCFNTimingData\w+)` \|)"), example(R"(\| (\S+) \| (\d+) \| `([0-9a-f ]+)` \|)");
    for (const std::smatch& row : matches(key)) documented.insert(row[1]);
    EXPECT_EQ(documented, keys);
    int examples = 0;
    for (const std::smatch& row : matches(example)) {
        ++examples;
        std::string hex;
        for (const unsigned char byte : socketAddress(row[1], std::stol(row[2])))
            hex += fmt::format("{}{:02x}", hex.empty() ? "" : " ", byte);
        EXPECT_EQ(hex, row.str(3)) << row.str(1);
    }
    EXPECT_EQ(examples, 2);
}

TEST_F(TimingDataTest, PeerAddressIsTheServers)
{
    for (const char* address : {"127.0.0.1", "::1"}) {
        TestHttpServer server(always({httpAnswer(200)}), {.address = address});
        const Value timing = load(server.url()).timing;
        const Bytes* bytes = timing["_kCFNTimingDataConnectionPeerAddress"].asBytes();
        ASSERT_NE(bytes, nullptr);
        EXPECT_EQ(*bytes, Bytes(socketAddress(address, *server.url().port())));
    }
}

} // namespace
} // namespace platform
