#include "tools/devserver/Uploads.h"

#include <array>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <openssl/evp.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tools/devserver/Service.h"
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

/// Raw DEFLATE: one block, stored.
std::string stored(std::string_view text)
{
    const std::size_t size = text.size();
    std::string packed = "\x01";
    for (const std::size_t part : {size, size >> 8, ~size, ~size >> 8}) packed += static_cast<char>(part & 0xff);
    return packed.append(text);
}

Request uploadOf(std::string path, std::string_view text, std::string digest)
{
    return {.method = "POST",
            .path = std::move(path),
            .headers = {{"Content-Encoding", "deflate"}, {"x-quorvane-digest", std::move(digest)}},
            .body = stored(text)};
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
        {R"(,"resource_versions":{},"first_use":true,"base_time":1700000000,"previous_session_end_reason":"session idle")",
         "", ""},
        {R"("fb":[{"type":"search_view_appear","timestamp":0},{"type":"search_start","timestamp":12}])", R"("fb":[])",
         ""},
        {R"("base_time":1700000000)", R"("base_time":0)", ""},
        {R"("first_use":true,)", "", "its keys are fb, agent, user_guid, resource_versions, base_time"},
        {R"("agent":"Vistrel/4","user_guid":"G")", R"("user_guid":"G","agent":"Vistrel/4")",
         "its keys are fb, user_guid"},
        {R"("agent":"Vistrel/4")", R"("agent":null)", "\"agent\" is no text"},
        {R"("resource_versions":{})", R"("resource_versions":[])", "\"resource_versions\" is no object"},
        {R"("first_use":true)", R"("first_use":1)", "\"first_use\" is no boolean"},
        {R"("base_time":1700000000)", R"("base_time":1.7e9)", "\"base_time\" is no whole number"},
        {R"("session idle")", R"("idle")", R"("previous_session_end_reason" is "idle")"},
        {"search_start", "search_begin", R"(fb[1] has the "type" "search_begin")"},
        {R"("timestamp":12)", R"("timestamp":-1)", R"(fb[1] has the "timestamp" -1)"},
        {R"(,"timestamp":12)", "", R"(fb[1] has the "timestamp" null)"},
        {R"("timestamp":0)", R"("timestamp":13)", "fb[1] is earlier"},
        {R"({"type":"search_start","timestamp":12})", "7", "fb[1] is no object"},
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
    EXPECT_EQ(sessionShapeProblem(Value::Array()), "it is no object");
    EXPECT_TRUE(sessionShapeProblem(platform::Dictionary()));
}

TEST(Uploads, SaysWhatIsWrongWithABody)
{
    const std::string good = sha512(kSession);
    EXPECT_EQ(checkUpload(uploadOf("/feedback", kSession, good)).problem, std::nullopt);

    Request request = uploadOf("/feedback", kSession, good);
    request.headers.erase(request.headers.begin());
    EXPECT_THAT(*checkUpload(request).problem, HasSubstr("Content-Encoding"));
    request = uploadOf("/feedback", kSession, good);
    request.headers.pop_back();
    EXPECT_THAT(*checkUpload(request).problem, HasSubstr("X-Quorvane-Digest"));
    request = uploadOf("/feedback", kSession, good);
    request.body = std::string(kSession);
    EXPECT_TRUE(checkUpload(request).problem) << "not packed";
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", kSession, sha512("{}"))).problem, HasSubstr("digest"));
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", "{", sha512("{"))).problem, HasSubstr("not JSON"));
    EXPECT_THAT(*checkUpload(uploadOf("/feedback", "{}", sha512("{}"))).problem, HasSubstr("not a session"));
    EXPECT_EQ(checkUpload(uploadOf("/crowdsourcing", "{}", sha512("{}"))).problem, std::nullopt) << "any object";
    EXPECT_TRUE(checkUpload(uploadOf("/crowdsourcing", "[]", sha512("[]"))).problem);
}

TEST(Uploads, RepeatsAreCountedAndEventsAreNot)
{
    Service service("https://127.0.0.1:8443");
    std::string line;
    service.onUpload = [&line](const std::string& text) { line = text; };
    const Request upload = uploadOf("/feedback", kSession, sha512(kSession));
    ASSERT_TRUE(service.faults.add("upload", "status:503,retryafter:7", 1));
    const Answer refused = service.answer(upload);
    EXPECT_EQ(refused.status, 503);
    EXPECT_EQ(*findHeader(refused.headers, "Retry-After"), "7");
    EXPECT_EQ(line, "upload 1: /feedback, agent Vistrel/4, 2 events, 235 bytes packed to 240, digest ok → 503");
    EXPECT_EQ(service.answer(upload).status, 200);
    EXPECT_EQ(service.answer(upload).status, 200);
    EXPECT_THAT(line, HasSubstr("digest ok, repeat 2 → 200"));
    ASSERT_TRUE(service.faults.add("upload", "cut", 1));
    EXPECT_TRUE(service.answer(uploadOf("/feedback", "\n{", sha512("x"))).cut);
    EXPECT_THAT(line, HasSubstr("digest wrong → 400, cut: "));

    const Value list = service.uploads.list();
    ASSERT_EQ(list.count(), 4u);
    EXPECT_EQ(list[0]["status"], Value(503));
    EXPECT_EQ(list[2]["repeat"], Value(2));
    EXPECT_EQ(list[2]["json"]["agent"], Value("Vistrel/4"));
    EXPECT_EQ(list[3]["repeat"], Value(0)) << "a digest that doesn't fit is nobody's";
    EXPECT_EQ(platform::toJson(service.uploads.totals()),
              R"({"received":4,"taken":2,"refused":2,"repeats":2,"events":2})");
    service.uploads.clear();
    EXPECT_EQ(service.uploads.totals()["received"], Value(0));
}

} // namespace
} // namespace devserver
