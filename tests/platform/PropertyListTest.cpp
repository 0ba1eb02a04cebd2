#include "platform/values/PropertyList.h"

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {
namespace {

/// A property list of the given objects, with 2-byte references; the first one is the root.
std::string propertyList(const std::vector<std::string>& objects)
{
    std::string file = "bplist00";
    std::string offsets;
    const auto append = [](std::string& to, std::uint64_t number, int width) {
        for (int i = width - 1; i >= 0; --i) to += static_cast<char>(number >> (8 * i));
    };
    for (const auto& object : objects) {
        append(offsets, file.size(), 3);
        file += object;
    }
    const std::size_t table = file.size();
    file += offsets + std::string(6, '\0') + "\x03\x02";
    append(file, objects.size(), 8);
    append(file, 0, 8);
    append(file, table, 8);
    return file;
}

/// An array of `count` references to one object.
std::string arrayOf(std::size_t count, std::size_t index)
{
    std::string object{'\xaf', '\x11', static_cast<char>(count >> 8), static_cast<char>(count)};
    for (std::size_t i = 0; i < count; ++i) object += {static_cast<char>(index >> 8), static_cast<char>(index)};
    return object;
}

TEST(PropertyList, EveryKindSurvivesTheRoundTrip)
{
    const Value value = Value::dictionaryOf({
        {"true", true},
        {"numbers", Value::Array{0, 1, 255, 256, 65536, 4294967296, INT64_MAX, -1, -5, INT64_MIN}},
        {"reals", Value::Array{0.0, 0.5, -1e300, 1.0}},
        {"texts", Value::Array{"", "plain", "gr\xc3\xbc\xc3\x9f \xf0\x9f\x98\x80", std::string(70'000, 'x')}},
        {"data", Bytes(std::string("\0\xff\x01", 3))},
        {"dates",
         Value::Array{dateFromSecondsSince1970(0), dateFromSecondsSince1970(1.7e9), dateFromSecondsSince1970(-1.5)}},
        {"nested", Dictionary{{"empty", Dictionary()}, {"list", Value::Array()}}},
        {"gr\xc3\xbc\xc3\x9f", "key"},
    });
    const auto read = parsePropertyList(toPropertyList(value).value());
    ASSERT_TRUE(read) << read.error().description();
    EXPECT_EQ(*read, value) << toJson(*read);
}

TEST(PropertyList, LeavesOutNullsAndWritesLargeUnsignedNumbersAsReals)
{
    const Value value = Value::dictionaryOf({{"a", nullptr}, {"b", Value::Array{nullptr, 1}}, {"c", UINT64_MAX}});
    EXPECT_EQ(parsePropertyList(toPropertyList(value).value()).value(),
              Value::dictionaryOf({{"b", Value::Array{1}}, {"c", 18446744073709551616.0}}));
}

TEST(PropertyList, RefusesToWriteWhatWouldBeLost)
{
    Value deep = 1;
    for (std::size_t i = 0; i < kMaximumDepth; ++i) deep = Value::Array{deep};
    EXPECT_TRUE(parsePropertyList(toPropertyList(deep).value()));
    for (const Value& value : {Value(), Value(Value::Array{deep}), Value(std::string(1, '\0')), Value("\xff"),
                               Value(Dictionary{{std::string("a\0b", 3), 1}}), Value(dateFromSecondsSince1970(9e9))})
        EXPECT_FALSE(toPropertyList(value)) << toJson(value);
}

TEST(PropertyList, ReadsKindsThatItsWriterNeverMakes)
{
    const std::string list("\xa7\0\x01\0\x02\0\x03\0\x04\0\x05\0\x06\0\x07", 15);
    const auto value = parsePropertyList(propertyList(
        {list, std::string("\x14\0\0\0\0\0\0\0\0\xff\xff\xff\xff\xff\xff\xff\xff", 17),
         std::string("\x14\xff\xff\xff\xff\xff\xff\xff\xff\x80\0\0\0\0\0\0\0", 17), std::string("\x22\x3f\0\0\0", 5),
         std::string("\x61\xd8\0", 3), "\x08", "\x10\xff", std::string("\x5f\x12\0\0\0\x02ok", 8)}));
    ASSERT_TRUE(value) << value.error().description();
    EXPECT_EQ(*value, (Value::Array{UINT64_MAX, INT64_MIN, 0.5, "\xef\xbf\xbd", false, 255, "ok"}));
}

TEST(PropertyList, RefusesHostileFiles)
{
    std::vector<std::string> sharing; // 2^40 objects, if they were copied
    for (std::size_t i = 1; i <= 40; ++i) sharing.push_back(arrayOf(2, i));
    sharing.push_back("\x09");
    std::vector<std::string> chain;
    for (std::size_t i = 1; i <= 60'000; ++i) chain.push_back(arrayOf(1, i));
    chain.push_back("\x09");
    const std::string longText = std::string("\x5f\x11\x40\x00", 4) + std::string(0x4000, 'x');

    const std::pair<const char*, std::string> cases[] = {
        {"cycle", propertyList({arrayOf(1, 0)})},
        {"mutual cycle", propertyList({arrayOf(1, 1), arrayOf(1, 0)})},
        {"shared containers", propertyList(sharing)},
        {"deep chain", propertyList(chain)},
        {"shared text beyond the limit", propertyList({arrayOf(20'000, 1), longText})},
        {"huge array", propertyList({std::string("\xaf\x13\xff\xff\xff\xff\xff\xff\xff\xff", 10)})},
        {"huge dictionary", propertyList({std::string("\xdf\x13\x40\0\0\0\0\0\0\0", 10)})},
        {"huge data", propertyList({std::string("\x4f\x13\x7f\xff\xff\xff\xff\xff\xff\xff", 10)})},
        {"huge UTF-16", propertyList({std::string("\x6f\x13\x80\0\0\0\0\0\0\0", 10)})},
        {"unique identifier", propertyList({"\x80\x01"})},
        {"set", propertyList({std::string("\xc1\0\x01", 3), "\x09"})},
        {"null", propertyList({std::string(1, '\0')})},
        {"number as key", propertyList({std::string("\xd1\0\x01\0\x01", 5), "\x10\x01"})},
        {"128-bit integer", propertyList({"\x14" + std::string(16, '\x01')})},
        {"infinite date", propertyList({std::string("\x33\x7f\xf0\0\0\0\0\0\0", 9)})},
        {"no object", propertyList({})},
        {"other format", "<?xml version=\"1.0\"?><plist version=\"1.0\"><true/></plist>"},
        {"empty", ""},
    };
    for (const auto& [name, file] : cases) {
        const auto value = parsePropertyList(file);
        ASSERT_FALSE(value) << name;
        EXPECT_NE(value.error().reason(), "") << name;
    }
    EXPECT_FALSE(parsePropertyList(propertyList({"\x09"}), 20));
}

} // namespace
} // namespace platform
