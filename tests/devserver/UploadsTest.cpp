#include "tools/devserver/Uploads.h"

#include <array>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <openssl/evp.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tests/support/Encodings.h"
#include "tools/devserver/SessionShape.h"

namespace devserver {
namespace {

using platform::Value;
using testing::HasSubstr;

std::string sha512(std::string_view text)
{
    std::array<unsigned char, 64> digest{};
    EVP_Digest(text.data(), text.size(), digest.data(), nullptr, EVP_sha512(), nullptr);
    std::string hexadecimal;
    for (const unsigned char byte : digest) hexadecimal += fmt::format("{:02x}", byte);
    return hexadecimal;
}

Request uploadOf(std::string path, std::string_view text, std::string digest)
{
    return {.method = "POST",
            .path = std::move(path),
            .headers = {{"Content-Encoding", "deflate"}, {"x-quorvane-digest", std::move(digest)}},
            .body = platform::test::storedDeflate(text)};
}

constexpr std::string_view kSession =
    R"({"fb":[{"type":"search_view_appear","timestamp":0},{"type":"search_start","timestamp":12}],"agent":"Vistrel/4",)"
    R"("user_guid":"G","resource_versions":{},"first_use":true,"base_time":1700000000,)"
    R"("previous_session_end_reason":"session idle"})";

TEST(SessionShape, NamesTheFirstThingThatIsWrong)
{
    const struct {
        std::string_view from, to; // a change to the session above
        std::string_view problem;  // empty: none
    } cases[] = {
        {"", "", ""},
        {R"("first_use":true,)", "", "its keys are fb, agent, user_guid, resource_versions, base_time"},
        {R"("agent":"Vistrel/4","user_guid":"G")", R"("user_guid":"G","agent":"Vistrel/4")",
         "its keys are fb, user_guid"},
        {R"("agent":"Vistrel/4")", R"("agent":null)", "\"agent\" is no text"},
        {R"("base_time":1700000000)", R"("base_time":1.7e9)", "\"base_time\" is no whole number"},
        {R"("session idle")", R"("idle")", R"("previous_session_end_reason" is "idle")"},
        {"search_start", "search_begin", R"(fb[1] has the "type" "search_begin")"},
        {R"("timestamp":12)", R"("timestamp":-1)", R"(fb[1] has the "timestamp" -1)"},
        {R"(,"timestamp":12)", "", R"(fb[1] has the "timestamp" null)"},
        {R"("timestamp":0)", R"("timestamp":13)", "fb[1] is earlier"},
    };
    for (const auto& [from, to, problem] : cases) {
        std::string text(kSession);
        ASSERT_NE(text.find(from), text.npos) << from;
        text.replace(text.find(from), from.size(), to);
        const auto found = sessionShapeProblem(*platform::parseJson(text));
        if (problem.empty())
            EXPECT_EQ(found, std::nullopt) << text;
        else
            EXPECT_THAT(found.value_or("no problem"), HasSubstr(problem)) << text;
    }
}

TEST(Uploads, SaysWhatIsWrongWithABody)
{
    const std::string good = sha512(kSession);
    Request request = uploadOf("/feedback", kSession, good);
    EXPECT_EQ(checkUpload(request).problem, std::nullopt);
    request.headers.pop_back();
    EXPECT_THAT(*checkUpload(request).problem, HasSubstr("X-Quorvane-Digest"));
    request = uploadOf("/feedback", kSession, good);
    request.body = std::string(kSession);
    EXPECT_TRUE(checkUpload(request).problem) << "not packed";
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", kSession, sha512("{}"))).problem, HasSubstr("digest"));
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", "{", sha512("{"))).problem, HasSubstr("not JSON"));
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", "{}", sha512("{}"))).problem, HasSubstr("not a session"));
    EXPECT_EQ(checkUpload(uploadOf("/crowdsourcing", "{}", sha512("{}"))).problem, std::nullopt) << "any object";
}

TEST(Uploads, CountsWhatDevicesCountAsSentAndOnce)
{
    const std::string text = R"({"fb":[{"type":"search_start","timestamp":0},)"
                             R"({"type":"session_missing_results","timestamp":0},)"
                             R"({"type":"session_missing_suggestions","timestamp":0}],"agent":"A/1","user_guid":"G"})";
    Uploads uploads;
    for (const auto& [status, cut] : {std::pair(503, false), {200, true}, {200, false}})
        uploads.add(checkUpload(uploadOf("/feedback", text, sha512(text))), Answer{.status = status, .cut = cut});
    EXPECT_EQ(platform::toJson(uploads.totals()),
              R"({"received":3,"taken":2,"refused":1,"repeats":2,"events":3,"recorded":1})");
}

TEST(Uploads, ASessionSaysWhatWasSentAndWhatCameFromMemory)
{
    const std::string text =
        R"({"fb":[{"endpoint_type":"tavrin_image","type":"network_search_start","timestamp":0},)"
        R"({"network_timing_data":[["ResponseEnd",9]],"type":"network_search_end","timestamp":9},)"
        R"({"endpoint_type":"tavrin_search","type":"network_search_start","timestamp":10},)"
        R"({"network_timing_data":[["FetchStart",0],["ResponseEnd",50]],"fbq":"n","type":"network_search_end",)"
        R"("timestamp":50},{"network_timing_data":null,"fbq":"n","type":"network_search_end","timestamp":60},)"
        R"({"network_timing_data":["ResponseEnd",7],"fbq":"n","type":"network_search_end","timestamp":60},)"
        R"({"uuid":"U","type":"unknown","timestamp":70},{"type":"unknown","timestamp":80}],)"
        R"("agent":"Vistrel/4","user_guid":"G"})";
    Uploads uploads;
    for (const std::string& json : {std::string("7"), text}) {
        Upload upload = checkUpload(uploadOf("/feedback", json, sha512(json)));
        const Answer answer = upload.answer();
        uploads.add(std::move(upload), answer);
    }
    const auto figures = [&](std::size_t i) { return platform::toJson(uploads.summaries()[i]["searches"]); };
    EXPECT_EQ(figures(0), R"({"sent":0,"from_memory":0,"latencies":[]})");
    EXPECT_EQ(figures(1), R"({"sent":1,"from_memory":1,"latencies":[50]})");
    EXPECT_FALSE(uploads.summaries()[1].asDictionary()->contains("json"));
    EXPECT_EQ(uploads.find(2)["json"]["agent"], Value("Vistrel/4"));
    EXPECT_TRUE(uploads.find(3).isNull());
}

} // namespace
} // namespace devserver
