#include <algorithm>
#include <array>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <regex>
#include <set>

#include <gmock/gmock.h>

#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVRecordClasses.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/records/RecordFilling.h"
#include "tests/support/BusMessages.h"

namespace tavrin {
namespace {

using platform::recordFromValue;
using platform::toValue;
using platform::unarchive;
using testing::StartsWith;

const platform::RecordClasses& all()
{
    return tavrindRecordClasses();
}

/// The record in a dictionary, by way of each coder.
std::array<platform::Result<std::shared_ptr<platform::Record>>, 2> decodedBothWays(const Value& dictionary)
{
    return {recordFromValue(dictionary, all()), unarchive(platform::archiveValue(dictionary), all())};
}

/// Calls `body` with a record of every class, all of its fields set, and with what they were set to.
template <class Body> void forEveryClass(Body body)
{
    for (const auto& [name, make] : all()) {
        SCOPED_TRACE(name);
        const auto record = make();
        body(*record, fill(*record, all()));
    }
}

std::set<std::string> classesDeclaredIn(const std::string& folder)
{
    static const std::regex kDeclaration("kClass = \"(\\w+)\"");
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(std::filesystem::path(SOURCE_DIR) / folder)) {
        if (entry.path().extension() != ".h") continue;
        std::ifstream stream(entry.path());
        const std::string text(std::istreambuf_iterator<char>(stream), {});
        for (std::sregex_iterator match(text.begin(), text.end(), kDeclaration), end; match != end; ++match)
            names.insert((*match)[1]);
    }
    return names;
}

TEST(RecordClasses, EveryDeclaredRecordIsRegisteredUnderItsName)
{
    std::set<std::string> client;
    for (const char* folder : {"searchrecords", "CoreTavrin"}) client.merge(classesDeclaredIn(folder));
    std::set<std::string> daemon = classesDeclaredIn("tavrind");
    EXPECT_TRUE(client.contains("ZRFeedback") && daemon.contains("TavrinFeedback"));
    daemon.insert(client.begin(), client.end());
    daemon.erase("ClientSession"); // the header of session files, which alone read it
    const auto expectRegistered = [](const platform::RecordClasses& classes, const std::set<std::string>& declared) {
        std::set<std::string> registered;
        for (const auto& [name, make] : classes) {
            registered.emplace(name);
            EXPECT_EQ(make()->className(), name);
        }
        EXPECT_EQ(registered, declared);
    };
    expectRegistered(coreRecordClasses(), client);
    expectRegistered(all(), daemon);
}

TEST(RecordClasses, EveryFieldSurvivesBothCodersUnderANameOfItsOwn)
{
    forEveryClass([](const platform::Record& record, const auto& given) {
        const Value value = toValue(record);
        EXPECT_EQ(value.count(), record.fieldCount() + 1);
        EXPECT_EQ(given.size(), record.fieldCount());
        for (const auto& [field, expected] : given) EXPECT_EQ(value[field], expected) << field;
        for (const auto& decoded : {recordFromValue(value, all()), unarchive(platform::archive(record), all())}) {
            ASSERT_TRUE(decoded) << decoded.error().description();
            EXPECT_EQ((*decoded)->className(), record.className());
            EXPECT_EQ(toValue(**decoded), value);
            EXPECT_EQ(platform::archive(**decoded), platform::archive(record));
        }
    });
}

TEST(RecordClasses, EveryRecordCrossesTheBusAsItsDictionaryDoes)
{
    for (const auto& [name, make] : coreRecordClasses()) {
        SCOPED_TRACE(name);
        const std::shared_ptr<platform::Record> record = make();
        for (const bool filled : {false, true}) {
            if (filled) fill(*record, coreRecordClasses());
            bool direct = false;
            EXPECT_EQ(platform::test::differenceOfMessages(record), "");
            const auto message = platform::test::sealedMessage({.args = {Value()}, .handles = {}, .records = {record}});
            EXPECT_EQ(platform::test::differenceOfRoads(message, coreRecordClasses, direct), "");
            EXPECT_TRUE(direct);
        }
    }
}

TEST(RecordClasses, WhatOtherClientsSendIsReadFromTheBusAsItsDictionaryIs)
{
    const auto expectSame = [](bool expected, unsigned entries, auto... rest) {
        const auto message = platform::test::newBusMessage();
        ASSERT_GE(sd_bus_message_append(message.get(), "a{sv}", entries, rest...), 0);
        ASSERT_GE(sd_bus_message_seal(message.get(), 1, 0), 0);
        bool direct = false;
        EXPECT_EQ(platform::test::differenceOfRoads(message, coreRecordClasses, direct), "");
        EXPECT_EQ(direct, expected);
    };
    const auto withField = [&](bool expected, const char* className, auto... field) {
        SCOPED_TRACE(className);
        expectSame(expected, 2u, "class", "s", className, field...);
    };
    // numbers of any width, other texts, arrays of one type, and keys that no record has
    withField(true, "ZRSearchResult", "queryId", "y", 7);
    withField(true, "ZRSearchResult", "queryId", "n", 7);
    withField(true, "ZRSearchResult", "queryId", "t", UINT64_MAX);
    withField(true, "ZRSearchResult", "type", "t", std::uint64_t{7});
    withField(true, "ZRSearchResult", "rankingScore", "u", 7);
    withField(true, "ZRSearchResult", "rankingScore", "t", UINT64_MAX);
    withField(true, "ZRSearchResult", "identifier", "o", "/a");
    withField(true, "ZRSearchResult", "localFeatures", "v", "a{ss}", 1, "k", "x");
    withField(false, "ZRSearchResult", "localFeatures", "(ii)", 1, 2);
    withField(true, "ZRPunchout", "urls", "as", 2, "a:", "b:");
    withField(true, "ZRPunchout", "urls", "av", 2, "s", "a:", "g", "a{sv}");
    withField(true, "ZRVisibleResultsFeedback", "results", "aa{sv}", 1, 1, "class", "s", "ZRSearchResult");
    withField(true, "ZRVisibleResultsFeedback", "results", "av", 1, "a{sv}", 1, "class", "s", "ZRSearchResult");
    withField(true, "ZRSearchResult", "unheardOf", "aas", 1, 1, "x");
    withField(false, "ZRSearchResult", "unheardOf", "(ii)", 1, 2);
    // what doesn't fit
    withField(false, "ZRSearchResult", "queryId", "i", -7);
    withField(false, "ZRSearchResult", "queryId", "d", 7.0);
    withField(false, "ZRSearchResult", "type", "t", UINT64_MAX);
    withField(false, "ZRSearchResult", "identifier", "ay", 1, 7);
    withField(false, "ZRSearchResult", "publiclyIndexable", "x", std::int64_t{1});
    withField(false, "ZRSearchResult", "title", "a{sv}", 0);
    withField(false, "ZRSearchResult", "title", "a{sv}", 1, "class", "s", "ZRPunchout");
    withField(false, "ZRPunchout", "urls", "ay", 1, 7);
    withField(false, "ZRPunchout", "urls", "a{sv}", 0);
    withField(false, "ZRVisibleResultsFeedback", "results", "av", 1, "a{sv}", 0);
    withField(false, "TAVCardRequest", "cardURL", "s", "no URL");
    withField(false, "ZRUnheardOf", "queryId", "t", std::uint64_t{7});
    // what fits only a dictionary
    expectSame(false, 0u);
    expectSame(false, 1u, "class", "x", std::int64_t{7});
    expectSame(false, 1u, "identifier", "s", "a");
    expectSame(false, 2u, "identifier", "s", "a", "class", "s", "ZRSearchResult");
    withField(false, "ZRSearchResult", "class", "s", "ZRPunchout");
    withField(false, "ZRSearchResult", "queryId", "v", "x", std::int64_t{7});
    expectSame(true, 3u, "class", "s", "ZRSearchResult", "queryId", "x", std::int64_t{1}, "queryId", "x",
               std::int64_t{2});
    expectSame(false, 3u, "class", "s", "ZRSearchResult", "queryId", "s", "one", "queryId", "x", std::int64_t{2});
}

TEST(RecordClasses, AnEventSurvivesARecordThatIsNoneOfAnEvent)
{
    const auto record = [](const char* name) {
        return Dictionary{{"class", name}, {"x", Dictionary{{"class", "ZRLater"}}}, {"rankingScore", "broken"}};
    };
    for (const Value& inner : {Value(record("ZRLater")), Value(record("ZRSearchResult")), Value("ZRClearInputFeedback"),
                               Value(7), Value(0.5), Value(true), Value(Bytes("x")), Value(nullptr),
                               Value(Value::Array{1, record("ZRClearInputFeedback")}), Value(Dictionary()),
                               Value(Dictionary{{"x", Dictionary{{"class", "ZRLater"}}}}),
                               Value(Dictionary{{"class", 5}, {"triggerEvent", 1}})}) {
        const Value value = Dictionary{{"class", "TavrinFeedback"}, {"feedback", inner}, {"query_id", 7}};
        for (const auto& decoded : decodedBothWays(value)) {
            ASSERT_TRUE(decoded) << decoded.error().description();
            const auto& event = dynamic_cast<const TavrinFeedback&>(**decoded);
            EXPECT_EQ(event.feedback(), nullptr) << platform::toJson(inner);
            EXPECT_EQ(event.queryId, 7);
        }
    }
    // A broken record of an event is damage.
    const Value broken = Dictionary{{"class", "ZRClearInputFeedback"}, {"triggerEvent", "x"}};
    for (const auto& decoded : decodedBothWays(Dictionary{{"class", "TavrinFeedback"}, {"feedback", broken}})) {
        ASSERT_FALSE(decoded);
        EXPECT_THAT(decoded.error().reason(), StartsWith("feedback.triggerEvent: "));
    }
}

TEST(RecordClasses, FieldsKeepWhatSubclassesAdd)
{
    struct {
        const char* owner;
        const char* field;
        Value given; ///< a record, or an array of one
    } const cases[] = {
        {"ZRCardSectionEngagementFeedback", "destination",
         Dictionary{{"class", "TAVPunchout"}, {"actionTarget", "buy"}}},
        {"ZRCardSectionEngagementFeedback", "cardSection", Dictionary{{"class", "ZRDescriptionCardSection"}}},
        {"ZRSearchResult", "customProperties", Dictionary{{"class", "TAVCustomSearchResult"}, {"fbr", "note"}}},
        {"ZRVisibleSuggestionsFeedback", "suggestions",
         Value::Array{Dictionary{{"class", "TAVSearchSuggestion"}, {"fbr", "note"}}}},
        {"TavrinFeedback", "feedback", Dictionary{{"class", "TAVRankerFeedback"}, {"resultCount", 5}}},
        {"TavrinFeedback", "feedback", Dictionary{{"class", "TavrinConnectionInvalidated"}}},
    };
    for (const auto& c : cases) {
        for (const auto& decoded : decodedBothWays(Dictionary{{"class", c.owner}, {c.field, c.given}})) {
            ASSERT_TRUE(decoded) << decoded.error().description();
            const Value read = toValue(**decoded)[c.field];
            const auto& [record, given] = read.asArray() ? std::pair(read[0], c.given[0]) : std::pair(read, c.given);
            for (const auto& [name, expected] : *given.asDictionary()) EXPECT_EQ(record[name], expected) << c.field;
        }
    }
}

TEST(RecordClasses, AUrlThatIsTakenCanBeReadAgain)
{
    for (const std::size_t length : {1'000u, 21'000u, 30'000u}) {
        std::string url = "https://example.com/";
        for (std::size_t i = 0; i < length; ++i) url += ' '; // three characters each, once encoded
        const auto record = recordFromValue(Dictionary{{"class", "TAVCardRequest"}, {"cardURL", url}}, all());
        EXPECT_EQ(record.has_value(), length < 30'000u);
        if (record) {
            EXPECT_TRUE(unarchive(platform::archive(**record), all()));
        }
    }
}

TEST(RecordClasses, EndsNameTheirStartAndStartsAreToldApart)
{
    EXPECT_EQ(ZREndNetworkSearchFeedback(nullptr, 10, 200, {}).uuid, std::nullopt);
    const auto start = std::make_shared<ZRStartNetworkSearchFeedback>(
        "a", "https://example.com/", Value(), StartSearchTrigger::Warm, EndpointType::TavrinWarm);
    const ZRStartNetworkSearchFeedback other("a", "https://example.com/", Value(), StartSearchTrigger::Warm,
                                             EndpointType::TavrinWarm);
    EXPECT_TRUE(platform::Uuid::parse(start->uuid.value_or("")));
    EXPECT_NE(start->uuid, other.uuid);
    const TAVEndNetworkSearchFeedback end(start, 10, 304, "OK", 0.5, "fbq", "10.0.0", Value());
    EXPECT_EQ(end.uuid, start->uuid);
    EXPECT_EQ(end.responseSize, 10);
    EXPECT_EQ(end.statusCode, 304);
}

} // namespace
} // namespace tavrin
