#include "platform/values/Record.h"

#include <chrono>

#include <gtest/gtest.h>

#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/ValueCoder.h"

namespace platform {
namespace {

enum class Color : std::int8_t { Red = 1, Blue = 2 };

struct Part : RecordOf<Part> {
    static constexpr std::string_view kClass = "Part";
    double score = 0;
    std::shared_ptr<Part> inner;
    static constexpr auto fields() { return std::tuple{field("score", &Part::score), field("inner", &Part::inner)}; }
};

struct Whole : RecordOf<Whole> {
    static constexpr std::string_view kClass = "Whole";
    bool flag = false;
    std::int16_t small = 0;
    std::uint64_t large = 0;
    Color color = Color::Red;
    std::string text;
    std::optional<std::string> note;
    Uuid uuid;
    Bytes bytes;
    Date date;
    Value any;
    std::optional<Error> error;
    std::vector<std::shared_ptr<Part>> parts;
    std::vector<std::string> names;
    std::optional<std::vector<std::string>> list;
    static constexpr auto fields()
    {
        return std::tuple{field("flag", &Whole::flag),   field("small", &Whole::small), field("large", &Whole::large),
                          field("color", &Whole::color), field("text", &Whole::text),   field("note", &Whole::note),
                          field("uuid", &Whole::uuid),   field("bytes", &Whole::bytes), field("date", &Whole::date),
                          field("any", &Whole::any),     field("error", &Whole::error), field("parts", &Whole::parts),
                          field("names", &Whole::names), field("list", &Whole::list)};
    }
};

struct Longer : RecordOf<Longer, Whole> {
    static constexpr std::string_view kClass = "Longer";
    std::int64_t extra = 0;
    static constexpr auto fields() { return std::tuple{field("extra", &Longer::extra)}; }
};

const RecordClasses& classes()
{
    static const RecordClasses all = RecordClasses::of<Part, Whole, Longer>();
    return all;
}

Value everyKind()
{
    return Value::Array{nullptr,
                        true,
                        -1,
                        INT64_MIN,
                        UINT64_MAX,
                        0.5,
                        1.0,
                        "text",
                        Bytes(std::string("\0\xff", 2)),
                        Date(Duration(-1)),
                        Date(Duration::min()),
                        Date(Duration::max()),
                        Value::dictionaryOf({{"z", Value::Array()}, {"a", Dictionary()}, {"n", nullptr}})};
}

std::shared_ptr<Longer> sample()
{
    auto record = std::make_shared<Longer>();
    record->flag = true;
    record->small = -300;
    record->large = UINT64_MAX;
    record->color = Color::Blue;
    record->text = "text";
    record->uuid = *Uuid::parse("0123ABCD-4567-89EF-0123-456789ABCDEF");
    record->bytes = Bytes(std::string(300, '\xff'));
    record->date = dateFromSecondsSince1970(1.7e9);
    record->any = everyKind();
    record->error = Error::withReason("D", -3, "why");
    record->error->underlying = std::make_shared<const Error>("U", 4);
    record->parts = {std::make_shared<Part>(), std::make_shared<Part>()};
    record->parts[1]->score = 2.5;
    record->parts[1]->inner = std::make_shared<Part>();
    record->names = {"a", "", "c"};
    record->extra = 7;
    return record;
}

template <class T> std::string reasonOf(const Result<T>& result)
{
    return result ? "" : result.error().reason();
}

/// Texts of MessagePack, in which a letter that follows an escape would belong to it.
const std::string kClassKey = std::string("\xa5") + "class", kPartName = std::string("\xa4") + "Part";

/// A MessagePack map with the class and one more entry, given as its raw bytes.
std::string partWith(std::string_view entry)
{
    return "\x82" + kClassKey + kPartName + std::string(entry);
}

TEST(Record, EveryFieldSurvivesBothEncodings)
{
    const auto record = sample();
    const Value value = toValue(*record);
    const std::string bytes = archive(*record);
    for (const auto& decoded : {recordFromValue(value, classes()), unarchive(bytes, classes())}) {
        ASSERT_TRUE(decoded) << decoded.error().description();
        EXPECT_EQ(toValue(**decoded), value);
        const auto longer = castRecord<Longer>(decoded);
        ASSERT_TRUE(longer);
        EXPECT_EQ((*longer)->any, everyKind());
        EXPECT_EQ(*(*longer)->error->underlying, Error("U", 4));
        EXPECT_EQ((*longer)->note, std::nullopt);
    }
    EXPECT_EQ(value["class"], Value("Longer"));
    const Value plain = valueFromArchive(bytes).value();
    EXPECT_EQ(plain["class"], Value("Longer"));
    EXPECT_EQ(plain["any"], everyKind());
    EXPECT_EQ(plain["parts"][1]["score"], Value(2.5));
    EXPECT_FALSE(castRecord<Part>(unarchive(bytes, classes())));
}

TEST(Record, NullFieldsAreLeftOut)
{
    EXPECT_EQ(toValue(Part()), Value::dictionaryOf({{"class", "Part"}, {"score", 0.0}}));
    EXPECT_EQ(archive(Part()),
              std::string("\xde\0\2", 3) + kClassKey + kPartName + std::string("\xa5score\xcb\0\0\0\0\0\0\0\0", 15));
    const Value whole = toValue(Whole());
    EXPECT_EQ(whole["names"], Value(Value::Array()));
    EXPECT_FALSE(whole.asDictionary()->contains("list"));
    EXPECT_FALSE(whole.asDictionary()->contains("any"));
}

TEST(Record, AnArrayThatMayBeMissingIsToldFromAnEmptyOne)
{
    Whole record;
    for (const auto& list : {std::optional<std::vector<std::string>>(), {{}}, {{"a"}}}) {
        record.list = list;
        for (const auto& decoded :
             {recordFromValue(toValue(record), classes()), unarchive(archive(record), classes())}) {
            ASSERT_TRUE(decoded) << decoded.error().description();
            EXPECT_EQ(std::dynamic_pointer_cast<Whole>(*decoded)->list, list);
        }
    }
}

TEST(Record, UnknownKeysAreSkippedAndMissingOnesReadAsZero)
{
    const Value value =
        Value::dictionaryOf({{"new", Value::Array{1, Dictionary{{"x", 2}}}}, {"score", 3}, {"class", "Part"}});
    EXPECT_EQ(std::dynamic_pointer_cast<Part>(recordFromValue(value, classes()).value())->score, 3);
    const std::string later = "\x83" + kClassKey + kPartName + "\xa3new\x92\x01\x81\xa1x\x02\xa5score\x03";
    EXPECT_EQ(std::dynamic_pointer_cast<Part>(unarchive(later, classes()).value())->score, 3);
}

TEST(Record, ErrorsNameTheField)
{
    const std::pair<Dictionary, std::string_view> cases[] = {
        {{{"flag", 1}}, "flag: expected a boolean, found an integer"},
        {{{"small", "7"}}, "small: expected an integer, found a string"},
        {{{"small", 1.0}}, "small: expected an integer, found a double"},
        {{{"small", 40'000}}, "small: number out of range"},
        {{{"color", 300}}, "color: number out of range"},
        {{{"large", -1}}, "large: number out of range"},
        {{{"extra", UINT64_MAX}}, "extra: number out of range"},
        {{{"uuid", "x"}}, "uuid: not a UUID"},
        {{{"bytes", "x"}}, "bytes: expected bytes, found a string"},
        {{{"error", Dictionary{{"code", "x"}}}}, "error: not an error"},
        {{{"names", Dictionary()}}, "names: expected an array, found a dictionary"},
        {{{"names", Value::Array{"a", false}}}, "names[1]: expected a string, found a boolean"},
        {{{"parts", Value::Array{Dictionary()}}}, "parts[0]: record without a class"},
        {{{"parts", Value::Array{nullptr}}}, "parts[0]: missing record"},
        {{{"parts", Value::Array{Dictionary{{"class", "Whole"}}}}}, "parts[0]: unexpected class Whole"},
        {{{"parts", Value::Array{Dictionary{{"class", "Other"}}}}}, "parts[0]: unknown class Other"},
        {{{"parts",
           Value::Array{Dictionary{{"class", "Part"}, {"inner", Dictionary{{"class", "Part"}, {"score", "x"}}}}}}},
         "parts[0].inner.score: expected a double, found a string"},
    };
    for (auto [fields, reason] : cases) {
        fields.set("class", "Longer");
        EXPECT_EQ(reasonOf(recordFromValue(fields, classes())), reason);
    }
    EXPECT_EQ(reasonOf(recordFromValue(Value::Array(), classes())), "expected a record, found an array");
    EXPECT_EQ(recordFromValue(Dictionary{{"class", "Other"}}, classes()).error().code, Decoder::kUnknownClass);
}

TEST(Record, BrokenArchivesAreRefusedWithAReason)
{
    using namespace std::string_literals;
    const std::pair<std::string, std::string_view> cases[] = {
        {"", "truncated"},
        {archive(Part()) + '\0', "trailing bytes"},
        {"\xdd\xff\xff\xff\xff\x01\x01\x01\x01\x01", "truncated"},
        {"\xdf\xff\xff\xff\xff" + kClassKey, "truncated"},
        {partWith("\xa5inner\xdb\xff\xff\xff\xff"), "inner: truncated"},
        {partWith("\xa5inner\xc6\xff\xff\xff\xff"), "inner: truncated"},
        {partWith("\xa1x\xc9\xff\xff\xff\xff\xff"), "x: truncated"},
        {"\xc1", "not an archive"},
        {"\x90", "expected a record, found an array"},
        {"\x80", "record without a class"},
        {"\x81\xa5score\x01", "record without a class"},
        {"\x81" + kClassKey + "\x01", "expected a class name, found an integer"},
        {"\x81" + kClassKey + "\xa3Pot", "unknown class Pot"},
        {partWith("\x01\x02"), "expected a key, found an integer"},
        {partWith("\xa5score\xa1x"), "score: expected a double, found a string"},
        {partWith("\xa5inner\x90"), "inner: expected a record, found an array"},
        {partWith("\xa1x\xd4\x05x"), "x: unknown extension type"},
        {partWith("\xa1x\xd5\xffxx"), "x: broken date"},
        {partWith("\xa1x\xd7\xff\xff\xff\xff\xff\0\0\0\0"s), "x: date out of range"},
        {partWith("\xa1x\xc7\x0c\xff\0\0\0\0\x7f\xff\xff\xff\xff\xff\xff\xff"s), "x: date out of range"},
        {partWith("\xa1x\xc7\x0c\xff\0\0\0\0\x80\0\0\0\0\0\0\0"s), "x: date out of range"},
    };
    for (const auto& [bytes, reason] : cases) EXPECT_EQ(reasonOf(unarchive(bytes, classes())), reason);
}

TEST(Record, ReadsEveryWidthOfDate)
{
    using namespace std::string_literals;
    const std::pair<std::string, Duration> cases[] = {
        {"\xd6\xff\x80\0\0\0"s, std::chrono::seconds(0x80000000u)},
        {"\xd7\xff\0\0\0\x05\0\0\0\x01"s, std::chrono::seconds(0x100000001) + Duration(1)},
        {"\xc7\x0c\xff\0\0\0\x01\xff\xff\xff\xff\xff\xff\xff\xff"s, std::chrono::seconds(-1) + Duration(1)},
    };
    for (const auto& [bytes, expected] : cases) {
        const auto record = unarchive("\x82" + kClassKey + "\xa5Whole\xa4" + "date" + bytes, classes());
        ASSERT_TRUE(record) << record.error().description();
        EXPECT_EQ(std::static_pointer_cast<Whole>(*record)->date.time_since_epoch(), expected);
    }
}

TEST(Record, DepthIsBounded)
{
    const auto chain = [](std::size_t length) {
        std::shared_ptr<Part> outer;
        for (std::size_t i = 0; i < length; ++i) {
            auto part = std::make_shared<Part>();
            part->inner = std::move(outer);
            outer = std::move(part);
        }
        return outer;
    };
    const auto nested = [](std::size_t depth) {
        Whole whole;
        for (std::size_t i = 0; i < depth; ++i) whole.any = Value::Array{whole.any};
        return whole;
    };
    EXPECT_TRUE(unarchive(archive(*chain(kMaximumDepth)), classes()));
    EXPECT_TRUE(recordFromValue(toValue(*chain(kMaximumDepth)), classes()));
    EXPECT_FALSE(unarchive(archive(*chain(kMaximumDepth + 1)), classes()));
    EXPECT_FALSE(recordFromValue(toValue(*chain(kMaximumDepth + 1)), classes()));
    EXPECT_TRUE(unarchive(archive(nested(kMaximumDepth)), classes()));
    EXPECT_FALSE(unarchive(archive(nested(kMaximumDepth + 1)), classes()));
    EXPECT_TRUE(valueFromArchive(archive(*chain(kMaximumDepth))));
    EXPECT_TRUE(valueFromArchive(archive(nested(kMaximumDepth)))) << "below a record, too";
    EXPECT_FALSE(valueFromArchive(std::string(1'000'000, '\x91') + '\x01'));
    EXPECT_TRUE(unarchive(partWith("\xa1x" + std::string(1'000'000, '\x91') + '\x01'), classes()));
}

} // namespace
} // namespace platform
