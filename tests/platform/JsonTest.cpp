#include "platform/values/Json.h"

#include <limits>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {
namespace {

TEST(Json, ReadsEdgeCasesExactlyAndWhatABrowserReads)
{
    const std::pair<std::string, Value> cases[]{
        {"\xef\xbb\xbf[1]", Value::Array{1}},
        {R"({"a":1,"b":2,"a":3})", Value::dictionaryOf({{"a", 3}, {"b", 2}})},
        {"-0", 0},
        {"-0.0", -0.0},
        {"1.0", 1.0},
        {"-9223372036854775808", INT64_MIN},
        {"9223372036854775808", std::uint64_t{1} << 63},
        {"18446744073709551615", UINT64_MAX},
        {"0.1000000000000000055511151231257827", 0.1},
        {"2.2250738585072011e-308", 2.2250738585072011e-308},
        {"5e-324", std::numeric_limits<double>::denorm_min()},
        {"1.7976931348623157e308", std::numeric_limits<double>::max()},
        {R"("\ud83d\ude00\u0000\/")", std::string_view("\xf0\x9f\x98\x80\0/", 6)},
        {" null ", nullptr},
        {"[]", Value::Array{}},
        {"{}", Dictionary{}},
        {R"("\ud800")", "\xef\xbf\xbd"},
        {R"("a\uDC00\ud83d\ude00\ud83d\ud83d\uDE00\ud800\u0041\ud800")",
         "a\xef\xbf\xbd\xf0\x9f\x98\x80\xef\xbf\xbd\xf0\x9f\x98\x80\xef\xbf\xbd"
         "A\xef\xbf\xbd"},
        {R"({"\ud800":"\\ud800 \"1e400\\","a":1e400})",
         Value::dictionaryOf({{"\xef\xbf\xbd", R"(\ud800 "1e400\)"}, {"a", std::numeric_limits<double>::max()}})},
        {"[1e400,-1e999999999999,1e-400,0.1,-1.5E+3,18446744073709551615,-9223372036854775808,7]",
         Value::Array{std::numeric_limits<double>::max(), -std::numeric_limits<double>::max(), 0.0, 0.1, -1500.0,
                      UINT64_MAX, INT64_MIN, 7}},
        {"[18446744073709551616,-9223372036854775809]", Value::Array{18446744073709551616.0, -9223372036854775808.0}},
        {"[" + std::string(400, '9') + "]", Value::Array{std::numeric_limits<double>::max()}},
    };
    for (const auto& [text, expected] : cases) {
        const auto value = parseJson(text);
        ASSERT_TRUE(value) << text << ": " << value.error().description();
        EXPECT_EQ(*value, expected) << text << " " << toJson(*value);
    }
}

TEST(Json, RefusesWhatIsNotJsonWithAReason)
{
    const auto expectRefused = [](std::initializer_list<std::string_view> texts) {
        for (const std::string_view text : texts) {
            const auto value = parseJson(text);
            ASSERT_FALSE(value) << text;
            EXPECT_EQ(value.error().code, kFormatMalformed) << text;
            EXPECT_NE(value.error().reason(), "") << text;
        }
    };
    expectRefused({"", " ", "\xef\xbb\xbf", "nul", "\xff\xfe["});
    expectRefused({"[1,]", "{\"a\"}", "{1:2}", "[1] [2]", "{}x", "[1", "[1e400", "[1e400 1]"});
    expectRefused({"[" + std::string(4 << 20, '0'), "[" + std::string(4 << 20, '-')}); // in no time
    expectRefused({"01", "+1", ".5", "NaN", "[01, 1e400]", "[+1, 1e400]", "1e400e1"});
    expectRefused({"\"a", "\"\n\"", "\"\xff\"", "\"\xed\xa0\x80\"", "\"\xc0\x80\""});
    expectRefused({R"("\ud8")", R"("\ud800\x")", R"("\ud800)"});
}

TEST(Json, BoundsDepthAndSize)
{
    for (const std::string_view innermost : {"", "1", "{}", R"({"a":1})", R"(1,{"a":[]})"}) {
        const std::size_t levels = kMaximumDepth - innermost.contains('{') - innermost.contains('[');
        const auto nested = [&](std::size_t depth) {
            return std::string(depth, '[').append(innermost) + std::string(depth, ']');
        };
        EXPECT_TRUE(parseJson(nested(levels))) << innermost;
        const auto deeper = parseJson(nested(levels + 1));
        ASSERT_FALSE(deeper) << innermost;
        EXPECT_TRUE(deeper.error().reason().starts_with("nested deeper")) << deeper.error().reason();
        EXPECT_TRUE(parseJson(nested(levels))) << "after one that was refused";
    }
    EXPECT_FALSE(parseJson(std::string(1'000'000, '[') + std::string(1'000'000, ']')));
    for (const char* three : {"[1,2,3]", R"([{"a":2}])", "[[[3]]]"}) {
        EXPECT_FALSE(JsonDocument::parse(three, 100, 3)) << three;
        EXPECT_TRUE(JsonDocument::parse(three, 100, 4)) << three;
    }
    EXPECT_FALSE(parseJson(std::string(1'000'000, '[')));
    EXPECT_TRUE(parseJson("[10]", 4));
    EXPECT_FALSE(parseJson("[100]", 4));
}

TEST(Json, ViewsReadWhatTheValueHas)
{
    const std::string many = [] { // more entries than are compared one by one, each twice
        std::string text;
        for (int i = 0; i < 60; ++i) text += fmt::format(R"({}"k{}":[{}])", i ? "," : "{", i % 30, i);
        return text + "}";
    }();
    for (const std::string_view text :
         {std::string_view("null"), std::string_view("[]"), std::string_view(R"("\u00fc\n\u0001\"")"),
          std::string_view(R"([-1,18446744073709551615,0.5,-0.0,1e300,true,false,null,{},""])"),
          std::string_view(R"({"a":1,"b":[2,{"c":"x"}],"a":{"d":3},"é":null})"),
          std::string_view(R"({"a":{"d":3},"b":[],"c":0,"a":4})"), std::string_view(many)}) {
        std::string copy(text);
        const auto document = JsonDocument::parse(copy);
        ASSERT_TRUE(document) << text;
        copy.assign(copy.size(), '!');               // it isn't needed any more
        const Value value = parseJson(text).value(); // another document at the same time
        const JsonView root = document->root();
        EXPECT_EQ(root.value(), value);
        EXPECT_EQ(root.json(), toJson(value));
        EXPECT_EQ(root.isArray(), value.asArray() != nullptr);
        EXPECT_EQ(root.isDictionary(), value.asDictionary() != nullptr);
        EXPECT_EQ(root.asString().has_value(), value.asString() != nullptr);
        EXPECT_EQ(root.asString().value_or(""), value.asString() ? *value.asString() : "");
        Value::Array elements;
        for (const JsonView element : root.elements()) elements.push_back(element.value());
        EXPECT_EQ(elements, value.asArray() ? *value.asArray() : Value::Array());
        std::string containers, expected;
        for (const auto& [key, inner] : root.containers()) containers += fmt::format("{}:{} ", key, inner.json());
        const auto expect = [&expected](const std::string& key, const Value& inner) {
            if (inner.asArray() || inner.asDictionary()) expected += fmt::format("{}:{} ", key, toJson(inner));
        };
        for (const Value& inner : value.asArray() ? *value.asArray() : Value::Array()) expect("", inner);
        for (const auto& [key, inner] : value.asDictionary() ? *value.asDictionary() : Dictionary()) {
            expect(key, inner);
            EXPECT_EQ(root[key].value(), inner) << key;
        }
        EXPECT_EQ(containers, expected);
    }
}

TEST(Json, ViewsOfNothingAreNull)
{
    const auto document = JsonDocument::parse(R"({"n":null,"d":{"x":1,"x":2}})").value();
    const JsonView root = document.root();
    EXPECT_TRUE(root.has("n"));
    for (const JsonView none : {root["x"], root["n"]["x"], JsonView()}) {
        EXPECT_FALSE(none.has("x") || none.isArray() || none.isDictionary() || none.asString());
        EXPECT_TRUE(none.value().isNull() && none.elements().empty() && none.containers().empty());
        EXPECT_EQ(none.json(), "null");
    }
    std::string duplicates;
    root["d"].eachEntry([&](std::string_view key, JsonView entry) { duplicates += std::string(key) + entry.json(); });
    root["n"].eachEntry([&](std::string_view, JsonView) { duplicates += "!"; });
    EXPECT_EQ(duplicates, "x1x2");
}

TEST(Json, WritesEveryKindAsDocumented)
{
    const std::pair<Value, std::string> cases[]{
        {nullptr, "null"},
        {true, "true"},
        {INT64_MIN, "-9223372036854775808"},
        {UINT64_MAX, "18446744073709551615"},
        {0.1, "0.1"},
        {1.0 / 3, "0.3333333333333333"},
        {5e-324, "5e-324"},
        {1e20, "1e+20"},
        {std::numeric_limits<double>::infinity(), "null"},
        {std::numeric_limits<double>::quiet_NaN(), "null"},
        {Bytes("\xff\xfe\xfd\xfc"), "\"//79/A==\""},
        {Bytes(std::string(10'000, '\0')), '"' + std::string(13'334, 'A') + "==\""}, // in chunks
        {dateFromSecondsSince1970(1.5), "1.5"},
        {std::string_view("a\"\\/\b\f\n\r\t\0\x1f\x7f\xc3\xa9", 14),
         "\"a\\\"\\\\/\\b\\f\\n\\r\\t\\u0000\\u001f\x7f\xc3\xa9\""},
        {"a\xff\xed\xa0\x80z\xe2\x82",
         "\"a\xef\xbf\xbd\xef\xbf\xbd\xef\xbf\xbd\xef\xbf\xbdz\xef\xbf\xbd\xef\xbf\xbd\""},
        {Value::dictionaryOf({{"z", Value::Array{1, nullptr}}, {"a", Dictionary()}}), R"({"z":[1,null],"a":{}})"},
    };
    for (const auto& [value, expected] : cases) {
        EXPECT_EQ(toJson(value), expected);
        EXPECT_EQ(jsonSize(value), expected.size());
    }
    EXPECT_EQ(toJson(cases[std::size(cases) - 1].first, JsonStyle::Pretty),
              "{\n  \"z\": [\n    1,\n    null\n  ],\n  \"a\": {}\n}");
}

} // namespace
} // namespace platform
