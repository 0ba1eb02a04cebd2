#include "platform/values/Value.h"

#include <limits>

#include <gtest/gtest.h>

#include "platform/base/Uuid.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"

namespace platform {
namespace {

Value nested(std::size_t depth)
{
    Value value;
    for (std::size_t i = 0; i < depth; ++i) {
        Value outer;
        if (i % 2)
            outer.mutableDictionary().set("k", std::move(value));
        else
            outer.mutableArray().push_back(std::move(value));
        value = std::move(outer);
    }
    return value;
}

TEST(Value, NumbersConvertOnlyWithoutLoss)
{
    struct {
        Value value;
        std::optional<std::int64_t> asInt;
        std::optional<std::uint64_t> asUInt;
    } const cases[] = {
        {-1, -1, {}},
        {7u, 7, 7},
        {UINT64_MAX, {}, UINT64_MAX},
        {3.0, 3, 3},
        {3.5, {}, {}},
        {-9223372036854775808.0, INT64_MIN, {}},
        {9223372036854775808.0, {}, 9223372036854775808u},
        {18446744073709551616.0, {}, {}},
        {std::numeric_limits<double>::quiet_NaN(), {}, {}},
        {true, {}, {}},
        {"7", {}, {}},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(c.value.asInt(), c.asInt) << "case " << (&c - cases);
        EXPECT_EQ(c.value.asUInt(), c.asUInt) << "case " << (&c - cases);
    }
}

TEST(Value, EqualityGoesByTypeAndContents)
{
    EXPECT_EQ(Value(5), Value(std::uint64_t{5}));
    EXPECT_NE(Value(1), Value(1.0));
    EXPECT_NE(Value(1), Value(true));
    EXPECT_NE(Value(-5), Value(static_cast<std::uint64_t>(-5)));
    EXPECT_NE(Value("a"), Value(Bytes("a")));
    EXPECT_EQ(Value::dictionaryOf({{"a", 1}, {"b", "x"}}), Value::dictionaryOf({{"b", "x"}, {"a", 1}}));
    EXPECT_NE(Value::dictionaryOf({{"a", 1}, {"b", nullptr}}), Value::dictionaryOf({{"a", 1}, {"c", nullptr}}));
}

TEST(Value, CopiesDoNotSeeEachOthersChanges)
{
    Value first = Value::dictionaryOf({{"list", Value::Array{1, 2}}});
    Value second = first;
    second.mutableDictionary().set("list", 3);
    EXPECT_EQ(first["list"].count(), 2u);
    Value list = first["list"];
    list.mutableArray().push_back(4);
    EXPECT_EQ(first["list"].count(), 2u);
    EXPECT_EQ(list[2].asInt(), 4);
}

TEST(Value, MovedFromIsNullAndMissingReadsAsNull)
{
    Value value = Value::Array{1};
    const Value taken = std::move(value);
    EXPECT_TRUE(value.isNull());
    EXPECT_TRUE(taken[7]["a"]["b"].isNull());
}

TEST(Value, MayBeReplacedByItsOwnPart)
{
    Value value = Value::dictionaryOf({{"a", Value::Array{"long enough to live on the heap, not inline"}}});
    value = value["a"];
    value = value[0];
    EXPECT_EQ(*value.asString(), "long enough to live on the heap, not inline");
    Dictionary outer{{"inner", Dictionary{{"x", 1}}}};
    outer = *outer.find("inner")->asDictionary();
    EXPECT_EQ(outer.size(), 1u);
    EXPECT_TRUE(outer.contains("x"));
}

TEST(Value, DeepNestingDoesNotExhaustTheStackWhenDestroyed)
{
    Value value = nested(200'000);
    const Value copy = value;
    value = nullptr;
    EXPECT_EQ(copy.count(), 1u);
}

TEST(Dictionary, KeepsOrderAndFindsEveryKeyThroughGrowthAndRemoval)
{
    Dictionary dictionary;
    for (int i = 0; i < 1000; ++i) dictionary.set("key" + std::to_string(i), i);
    dictionary.set("key3", "again");
    EXPECT_TRUE(dictionary.remove("key0"));
    EXPECT_FALSE(dictionary.remove("key0"));
    const Dictionary copy = dictionary;
    ASSERT_EQ(copy.size(), 999u);
    EXPECT_EQ(copy.begin()->first, "key1");
    EXPECT_EQ(*copy.find("key3"), Value("again"));
    for (int i = 4; i < 1000; ++i) ASSERT_EQ(*copy.find("key" + std::to_string(i)), Value(i));
    for (int i = 1; i < 995; ++i) ASSERT_TRUE(dictionary.remove("key" + std::to_string(i)));
    EXPECT_EQ(dictionary,
              (Dictionary{{"key999", 999}, {"key998", 998}, {"key997", 997}, {"key996", 996}, {"key995", 995}}));
    const Dictionary taken = std::move(dictionary);
    EXPECT_TRUE(dictionary.empty());
    EXPECT_FALSE(dictionary.contains("key999"));
}

TEST(Uuid, ReadsOnlyTheTextForm)
{
    const auto uuid = Uuid::parse("0123abcd-4567-89EF-0123-456789abcdef");
    ASSERT_TRUE(uuid);
    EXPECT_EQ(uuid->string(), "0123ABCD-4567-89EF-0123-456789ABCDEF");
    for (const char* text : {"", "0123abcd456789ef0123456789abcdef", "0123abcd-4567-89ef-0123-456789abcdef0",
                             "0123abcd-4567-89ef-0123-456789abcdeg", "0123abcd-4567-89ef-0123+456789abcdef"})
        EXPECT_FALSE(Uuid::parse(text)) << text;
}

TEST(Uuid, RandomOnesDifferAndCarryTheirVersion)
{
    const Uuid uuid = Uuid::random();
    EXPECT_NE(uuid, Uuid::random());
    EXPECT_EQ(uuid.string()[14], '4');
    EXPECT_EQ(Uuid::parse(uuid.string()), uuid);
}

TEST(Error, DescribesItself)
{
    EXPECT_EQ(Error::withReason("Format", 3, "no luck").description(), "Format 3: no luck");
    EXPECT_EQ(Error("Format", 3).description(), "Format 3");
    EXPECT_EQ(Error::posix(2, "open").description(), "POSIX 2: open: No such file or directory");
}

} // namespace
} // namespace platform
