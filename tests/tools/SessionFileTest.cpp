#include "tools/tavrinctl/SessionFile.h"

#include <gmock/gmock.h>

#include "platform/values/Archive.h"
#include "platform/values/Record.h"
#include "tests/support/Encodings.h"

namespace tavrin::ctl {
namespace {

using platform::Value;
using platform::test::framed;
using testing::HasSubstr;

std::string record(const Value& value)
{
    return framed(platform::archiveValue(value));
}

const std::string kVersion = record(Value("tavrind/1"));
const std::string kSession = record(Value::dictionaryOf({{"class", "ClientSession"}, {"agent", "A"}}));
const std::string kEvent = record(Value::dictionaryOf(
    {{"class", "TavrinFeedback"}, {"feedback", Value::dictionaryOf({{"class", "ZRFeedback"}, {"timestamp", 7}})}}));

TEST(SessionFile, ReadsEveryRecordWithItsPlace)
{
    const SessionFile file = readSessionFile(kVersion + kSession + kEvent + kEvent);
    EXPECT_FALSE(file.damage);
    EXPECT_EQ(file.version, "tavrind/1");
    EXPECT_EQ(file.session["agent"], Value("A"));
    ASSERT_EQ(file.events.size(), 2u);
    EXPECT_EQ(file.events[1].offset, kVersion.size() + kSession.size() + kEvent.size());
    EXPECT_EQ(file.events[1].size, kEvent.size());
    EXPECT_EQ(file.events[1].value["feedback"]["timestamp"], Value(7));
    EXPECT_FALSE(readSessionFile(kVersion + kSession).damage) << "a session may be empty";
}

TEST(SessionFile, DamageHasItsPlaceAndKeepsWhatIsBefore)
{
    const std::string whole = kVersion + kSession + kEvent;
    std::string huge = record(Value("x"));
    huge[7] = '\x7f';
    const struct {
        std::string bytes;
        std::size_t offset;
        std::size_t events;
        const char* reason;
    } cases[] = {
        {"", 0, 0, "empty"},
        {kVersion, kVersion.size(), 0, "ends before its session"},
        {kSession, 0, 0, "not the version"},
        {kVersion + kEvent, kVersion.size(), 0, "not a session"},
        {kVersion + kSession + kSession, kVersion.size() + kSession.size(), 0, "no event"},
        {whole + "1234567", whole.size(), 1, "7 bytes"},
        {whole + std::string(8, '\0'), whole.size(), 1, "empty record"},
        {whole + huge, whole.size(), 1, "cut off"},
        {whole + kEvent.substr(0, kEvent.size() - 1), whole.size(), 1, "cut off"},
        {whole + framed("\xc1"), whole.size(), 1, "not an archive"},
        {whole + framed("\xc0\xc0"), whole.size(), 1, "trailing bytes"},
        {whole + framed(std::string(100'000, '\x91') + "\xc0"), whole.size(), 1, "too deep"},
    };
    for (const auto& [bytes, offset, events, reason] : cases) {
        const SessionFile file = readSessionFile(bytes);
        ASSERT_TRUE(file.damage) << reason;
        EXPECT_EQ(file.damage->offset, offset) << reason;
        EXPECT_THAT(file.damage->reason, HasSubstr(reason));
        EXPECT_EQ(file.events.size(), events) << reason;
    }
}

} // namespace
} // namespace tavrin::ctl
