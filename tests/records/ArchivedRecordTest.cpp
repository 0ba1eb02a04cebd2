#include "platform/values/ArchivedRecord.h"

#include <gtest/gtest.h>

#include "CoreTavrin/TAVFeedback.h"
#include "platform/values/Archive.h"
#include "platform/values/Json.h"
#include "platform/values/JsonSink.h"
#include "searchrecords/ZRRecords.h"
#include "tests/records/FeedbackExamples.h"
#include "tests/records/RecordFilling.h"

namespace tavrin {
namespace {

using platform::OpenArchive;
using platform::operator""_field;

/// The event in an archive as text; nothing if the archive can't be read in place.
std::optional<std::string> textOf(std::string_view archive)
{
    OpenArchive open(tavrindRecordClasses());
    if (!open.open(archive)) return std::nullopt;
    platform::JsonTextSink text;
    platform::JsonValueSink value;
    TavrinFeedback::write(text, open.root().as<TavrinFeedback>(), 7);
    TavrinFeedback::write(value, open.root().as<TavrinFeedback>(), 7);
    EXPECT_EQ(text.text(), platform::toJson(value.take()));
    return text.text();
}

/// A map entry of MessagePack with a short key.
std::string entry(const std::string& key, const std::string& value)
{
    return static_cast<char>(0xa0 | key.size()) + key + value;
}

std::string map(std::initializer_list<std::string> entries)
{
    std::string bytes(1, static_cast<char>(0x80 | entries.size()));
    for (const std::string& each : entries) bytes += each;
    return bytes;
}

std::string resultOf(std::initializer_list<std::string> entries)
{
    std::string bytes(1, static_cast<char>(0x81 + entries.size()));
    bytes += entry("class", "\xaeZRSearchResult");
    for (const std::string& each : entries) bytes += each;
    return bytes;
}

TEST(ArchivedRecord, FieldsReadAsTheRecordHasThem)
{
    ZRSearchResult record;
    record.identifier = std::string(300, 'x');
    record.queryId = UINT64_MAX;
    record.type = static_cast<ResultType>(-5);
    record.rankingScore = 0.1;
    record.publiclyIndexable = true;
    record.title = std::make_shared<ZRText>();
    record.title->text = "t";
    record.punchout = std::make_shared<TAVPunchout>();
    record.punchout->urls = {"a:", "b:"};
    record.localFeatures = Dictionary{{"a", Value::Array{1, nullptr, Bytes("b")}}, {"d", Dictionary()}};
    record.customProperties = std::make_shared<TAVCustomSearchResult>();
    const std::string bytes = platform::archive(record);
    OpenArchive open(tavrindRecordClasses());
    ASSERT_TRUE(open.open(bytes));
    const auto read = open.root().as<ZRSearchResult>();
    EXPECT_EQ(read["identifier"_field], record.identifier);
    EXPECT_EQ(read["queryId"_field], UINT64_MAX);
    EXPECT_EQ(read["type"_field], record.type);
    EXPECT_EQ(read["rankingScore"_field], 0.1);
    EXPECT_TRUE(read["publiclyIndexable"_field]);
    EXPECT_EQ(read["title"_field]["text"_field], "t");
    std::string urls;
    for (const std::string_view url : read["punchout"_field]["urls"_field]) urls += url;
    EXPECT_EQ(urls, "a:b:");
    EXPECT_EQ(read["localFeatures"_field].value(), record.localFeatures);
    EXPECT_EQ(read["correctedQuery"_field], std::nullopt);
    EXPECT_TRUE(read["customProperties"_field].as<TAVCustomSearchResult>());
    EXPECT_FALSE(read["customProperties"_field].as<ZRPunchout>());
    EXPECT_EQ(read["punchout"_field].as<TAVPunchout>()["actionTarget"_field], std::nullopt);
    EXPECT_EQ(platform::archive(**platform::unarchive(read["punchout"_field].bytes(), tavrindRecordClasses())),
              platform::archive(*record.punchout));

    const platform::ArchivedRecord<ZRSearchResult> none;
    EXPECT_EQ(none["title"_field]["text"_field], std::nullopt);
    EXPECT_TRUE(none["punchout"_field]["urls"_field].empty());
    EXPECT_EQ(none["topHit"_field], TopHit::No);
}

TEST(ArchivedRecord, OnlyArchivesAsTheyAreWrittenAreReadInPlace)
{
    const std::string seven = "\x07", text = "\xa1x", null = "\xc0";
    const std::pair<bool, std::string> cases[] = {
        {true, resultOf({})},
        {true, resultOf({entry("queryId", seven)})},
        {true, resultOf({entry("queryId", "\xcc\x07")})}, // a longer form of a number
        {true, resultOf({entry("rankingScore", seven)})},
        {true, resultOf({entry("queryId", seven), entry("type", "\xff")})},
        {true, resultOf({entry("localFeatures", null)})},
        {false, resultOf({entry("type", seven), entry("queryId", seven)})}, // another order
        {false, resultOf({entry("queryId", seven), entry("queryId", seven)})},
        {false, resultOf({entry("x", seven)})},
        {false, resultOf({entry("identifier", null)})},
        {false, resultOf({entry("queryId", "\xff")})},
        {false, resultOf({entry("queryId", text)})},
        {false, resultOf({entry("identifier", seven)})},
        {false, resultOf({entry("title", map({entry("class", "\xa9ZRUnheard")}))})},
        {false, resultOf({entry("title", resultOf({}))})},
        {false, resultOf({entry("title", map({}))})},
        {false, resultOf({}) + seven},
        {false, map({entry("queryId", seven), entry("class", "\xaeZRSearchResult")})},
        {false, map({})},
        {false, seven},
        {false, ""},
    };
    OpenArchive open(tavrindRecordClasses());
    for (const auto& [expected, bytes] : cases) EXPECT_EQ(open.open(bytes), expected) << bytes;
}

TEST(ArchivedRecord, WhatIsReadInPlaceIsReadAsTheRecordIs)
{
    int opened = 0;
    int refused = 0;
    for (const auto& [name, make] : tavrindRecordClasses()) {
        SCOPED_TRACE(name);
        const auto record = std::dynamic_pointer_cast<ZRFeedback>(make());
        if (!record) continue;
        fill(*record, tavrindRecordClasses());
        const std::string whole = platform::archive(TavrinFeedback(record, 12, "guid", "agent", 3));
        ASSERT_TRUE(textOf(whole));
        for (std::size_t i = 0; i < whole.size(); ++i) {
            for (const char byte : {'\0', '\x80', '\xc0', '\xa1', '\xff', static_cast<char>(whole[i] + 1)}) {
                std::string broken = whole;
                broken[i] = byte;
                const auto text = textOf(broken);
                ++(text ? opened : refused);
                if (!text) continue;
                const auto decoded = platform::unarchive(broken, tavrindRecordClasses());
                ASSERT_TRUE(decoded) << i << " " << decoded.error().description();
                ASSERT_EQ(text, textOf(platform::archive(**decoded))) << i;
            }
        }
    }
    EXPECT_GT(opened, 1000);
    EXPECT_GT(refused, 1000);
}

TEST(ArchivedRecord, PlainValuesAreWrittenAsToJsonWritesThem)
{
    std::string everyByte;
    for (int byte = 0; byte < 256; ++byte) everyByte += static_cast<char>(byte);
    const Value values[] = {nullptr,
                            true,
                            INT64_MIN,
                            UINT64_MAX,
                            0.1,
                            -0.0,
                            1e300,
                            std::numeric_limits<double>::infinity(),
                            everyByte,
                            "gr\u00fc\u00dfe",
                            "1234567\"",
                            "12345678\\",
                            "\x7f",
                            Bytes("abc"),
                            platform::dateFromSecondsSince1970(1.5),
                            Value::Array(),
                            Dictionary(),
                            Value::Array{Value::Array{1, 2}, Dictionary{{"a\n", Dictionary{{"b", 1}}}, {"c", "d"}}}};
    Dictionary large;
    for (int i = 0; i < 100; ++i) large.set(std::to_string(i), i);
    ZRSearchResult result;
    for (const Value& each : values) {
        result.localFeatures = Dictionary{{"v", each}, {"large", large}};
        const std::string bytes = platform::archive(result);
        OpenArchive open(tavrindRecordClasses());
        ASSERT_TRUE(open.open(bytes));
        const auto archived = open.root().as<ZRSearchResult>()["localFeatures"_field];
        platform::JsonTextSink text;
        platform::JsonValueSink value;
        archived.write(text);
        archived.write(value);
        EXPECT_EQ(text.text(), platform::toJson(result.localFeatures));
        EXPECT_EQ(value.take(), result.localFeatures);
    }
    // Of keys that a damaged file has twice, the last counts.
    const std::string twice =
        resultOf({entry("localFeatures", map({entry("a", "\x01"), entry("b", "\x02"), entry("a", "\x03")}))});
    OpenArchive open(tavrindRecordClasses());
    ASSERT_TRUE(open.open(twice));
    platform::JsonTextSink text;
    open.root().as<ZRSearchResult>()["localFeatures"_field].write(text);
    EXPECT_EQ(text.text(), R"({"a":3,"b":2})");
}

} // namespace
} // namespace tavrin
