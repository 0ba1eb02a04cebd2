#include "platform/values/Json.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <clocale>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <unordered_map>

#include <fmt/format.h>
#include <simdjson.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/JsonText.h"

namespace platform {

namespace {

// Reading

namespace dom = simdjson::dom;

/// Each thread reuses a parser whose capacity is at most this; a parser takes about 15 times its capacity in memory.
constexpr std::size_t kKeptParserCapacity = 64u << 10;

thread_local std::unique_ptr<dom::parser> keptParser;

/// Returns true if containers nest deeper than `levels`. Unlike the parser, counts empty containers too.
bool nestsDeeper(dom::element element, std::size_t levels)
{
    if (dom::array array; element.get(array) == simdjson::SUCCESS)
        return levels == 0 ||
               std::ranges::any_of(array, [levels](auto inner) { return nestsDeeper(inner, levels - 1); });
    if (dom::object object; element.get(object) == simdjson::SUCCESS)
        return levels == 0 ||
               std::ranges::any_of(object, [levels](auto entry) { return nestsDeeper(entry.value, levels - 1); });
    return false;
}

/// Returns true if the text has at least `values` separators. Every value but the first is after one.
bool mayHaveMoreValues(std::string_view text, std::size_t values)
{
    if (text.size() <= values) return false;
    const auto isSeparator = [](char c) { return c == ',' || c == ':' || c == '[' || c == '{'; };
    return static_cast<std::size_t>(std::ranges::count_if(text, isSeparator)) >= values;
}

simdjson::error_code parseBounded(dom::parser& parser, std::string_view text, dom::element& root)
{
    // The parser doesn't count empty containers. With this limit no document nests too deep even with an empty
    // container in the innermost level; nearly every document passes.
    if (parser.max_depth() != kMaximumDepth)
        if (const auto error = parser.allocate(parser.capacity(), kMaximumDepth)) return error;
    auto error = parser.parse(text.data(), text.size()).get(root);
    if (error != simdjson::DEPTH_ERROR) return error;

    // With one level more, the levels are counted here.
    error = parser.allocate(parser.capacity(), kMaximumDepth + 1);
    if (!error) error = parser.parse(text.data(), text.size()).get(root);
    return !error && nestsDeeper(root, kMaximumDepth) ? simdjson::DEPTH_ERROR : error;
}

// Numbers and escapes that a browser accepts and the parser refuses

/// Returns the length of the number that the text begins with; 0 if it doesn't begin with a JSON number.
std::size_t numberLength(std::string_view text)
{
    std::size_t at = text.starts_with('-') ? 1 : 0;
    const auto digits = [&] {
        const std::size_t begin = at;
        while (at < text.size() && text[at] >= '0' && text[at] <= '9') ++at;
        return at - begin;
    };
    const auto skip = [&](std::string_view any) {
        const bool found = at < text.size() && any.contains(text[at]);
        at += found;
        return found;
    };
    const bool leadingZero = text.substr(at).starts_with('0');
    const std::size_t whole = digits();
    if (whole == 0 || (leadingZero && whole > 1)) return 0;
    if (skip(".") && digits() == 0) return 0;
    if (!skip("eE")) return at;
    skip("+-");
    return digits() == 0 ? 0 : at;
}

/// Rewrites a number for the parser: integers beyond 64 bits as doubles, numbers beyond a double as the largest one.
std::string readableNumber(const std::string& text)
{
    const auto reads = [&]<class Integer>(Integer number) {
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
        return error == std::errc() && end == text.data() + text.size();
    };
    const bool isInteger = text.find_first_of(".eE") == std::string::npos;
    if (isInteger && (reads(std::int64_t{}) || reads(std::uint64_t{}))) return text;
    static const locale_t plain = newlocale(LC_NUMERIC_MASK, "C", nullptr);
    const double number = strtod_l(text.c_str(), nullptr, plain);
    if (!isInteger && std::isfinite(number)) return text;
    constexpr double kLargest = std::numeric_limits<double>::max();
    std::array<char, 32> digits;
    const auto result = std::to_chars(digits.begin(), digits.end(), std::clamp(number, -kLargest, kLargest),
                                      std::chars_format::scientific);
    return {digits.begin(), result.ptr};
}

/// Returns the code unit of the escape "\uXXXX" that the text begins with, or nothing.
std::optional<unsigned> escapedUnit(std::string_view text)
{
    constexpr std::size_t kLength = 6;
    unsigned unit = 0;
    if (!text.starts_with("\\u") || text.size() < kLength) return std::nullopt;
    const auto [end, error] = std::from_chars(text.data() + 2, text.data() + kLength, unit, 16);
    return error == std::errc() && end == text.data() + kLength ? std::optional(unit) : std::nullopt;
}

/// Replaces the numbers and escapes that a browser accepts and the parser refuses. Keeps everything else.
std::string mended(std::string_view text)
{
    std::string result;
    result.reserve(text.size());
    bool inString = false;
    while (!text.empty()) {
        std::size_t length = 1;
        if (const auto unit = inString ? escapedUnit(text) : std::nullopt) {
            length = 6;
            const auto next = escapedUnit(text.substr(length));
            const bool high = *unit >= 0xd800 && *unit < 0xdc00;
            const bool low = *unit >= 0xdc00 && *unit < 0xe000;
            if (high && next && *next >= 0xdc00 && *next < 0xe000)
                result += text.substr(0, length *= 2);
            else
                result += high || low ? "\\ufffd" : text.substr(0, length);
        } else if (const std::size_t digits = inString ? 0 : numberLength(text)) {
            length = digits;
            result += readableNumber(std::string(text.substr(0, length)));
        } else if (const std::size_t run = inString ? 0 : text.find_first_not_of("+-.eE0123456789")) {
            length = std::min(run, text.size()); // no number: taken whole, or each of its digits would be scanned again
            result += text.substr(0, length);
        } else {
            if (inString && text.front() == '\\') length = std::min<std::size_t>(2, text.size());
            if (text.front() == '"') inString = !inString;
            result += text.substr(0, length);
        }
        text.remove_prefix(length);
    }
    return result;
}

/// Returns the entries as a Dictionary keeps them: the last of duplicate keys, at the place of the first.
std::vector<dom::key_value_pair> entriesOf(dom::object object)
{
    constexpr std::size_t kFew = 16; // compared one by one
    std::vector<dom::key_value_pair> entries;
    entries.reserve(object.size());
    std::unordered_map<std::string_view, std::size_t> places; // of many entries
    if (object.size() > kFew) places.reserve(object.size());
    for (const auto& entry : object) {
        std::size_t place = entries.size();
        if (object.size() > kFew) {
            place = places.try_emplace(entry.key, place).first->second;
        } else {
            const auto same = std::ranges::find(entries, entry.key, &dom::key_value_pair::key);
            place = static_cast<std::size_t>(same - entries.begin());
        }
        if (place == entries.size())
            entries.push_back(entry);
        else
            entries[place].value = entry.value;
    }
    return entries;
}

bool isContainer(dom::element element)
{
    return element.is_array() || element.is_object();
}

Value convert(dom::element element);

Value convertArray(dom::array array)
{
    Value::Array elements;
    elements.reserve(array.size());
    for (const dom::element element : array) elements.push_back(convert(element));
    return elements;
}

Value convertObject(dom::object object)
{
    Dictionary entries;
    entries.reserve(object.size());
    for (const auto& [key, element] : object) entries.set(std::string(key), convert(element));
    return entries;
}

Value convert(dom::element element)
{
    switch (element.type()) {
    case dom::element_type::ARRAY: return convertArray(element.get_array().value_unsafe());
    case dom::element_type::OBJECT: return convertObject(element.get_object().value_unsafe());
    case dom::element_type::INT64: return element.get_int64().value_unsafe();
    case dom::element_type::UINT64: return element.get_uint64().value_unsafe();
    case dom::element_type::DOUBLE: return element.get_double().value_unsafe();
    case dom::element_type::STRING: return element.get_string().value_unsafe();
    case dom::element_type::BOOL: return element.get_bool().value_unsafe();
    case dom::element_type::NULL_VALUE: break;
    }
    return {};
}

// Writing

/// Stores the text.
struct TextSink {
    std::string text;
    void put(char c) { text += c; }
    void put(std::string_view part) { text += part; }
};

/// Counts the bytes.
struct CountingSink {
    std::size_t count = 0;
    void put(char) { ++count; }
    void put(std::string_view part) { count += part.size(); }
};

template <class Sink> class JsonWriter {
public:
    JsonWriter(Sink& sink, JsonStyle style) : _sink(sink), _pretty(style == JsonStyle::Pretty) {}

    void write(const Value& value)
    {
        switch (value.type()) {
        case Value::Type::Null: return _sink.put("null");
        case Value::Type::Bool: return _sink.put(*value.asBool() ? "true" : "false");
        case Value::Type::Int: return json::putNumber(_sink, *value.asInt());
        case Value::Type::UInt: return json::putNumber(_sink, *value.asUInt());
        case Value::Type::Double: return json::putReal(_sink, *value.asDouble());
        case Value::Type::String: return json::putString(_sink, *value.asString());
        case Value::Type::Bytes: return json::putBase64(_sink, value.asBytes()->view());
        case Value::Type::Date: return json::putReal(_sink, secondsSince1970(*value.asDate()));
        case Value::Type::Array: return writeArray(*value.asArray());
        case Value::Type::Dictionary: return writeDictionary(*value.asDictionary());
        }
    }

    void write(dom::element element)
    {
        switch (element.type()) {
        case dom::element_type::ARRAY:
            return writeContainer('[', ']', element.get_array().value_unsafe(),
                                  [this](dom::element inner) { write(inner); });
        case dom::element_type::OBJECT:
            return writeContainer('{', '}', entriesOf(element.get_object().value_unsafe()),
                                  [this](const dom::key_value_pair& entry) {
                                      writeKey(entry.key);
                                      write(entry.value);
                                  });
        case dom::element_type::INT64: return json::putNumber(_sink, element.get_int64().value_unsafe());
        case dom::element_type::UINT64: return json::putNumber(_sink, element.get_uint64().value_unsafe());
        case dom::element_type::DOUBLE: return json::putReal(_sink, element.get_double().value_unsafe());
        case dom::element_type::STRING: return json::putString(_sink, element.get_string().value_unsafe());
        case dom::element_type::BOOL: return _sink.put(element.get_bool().value_unsafe() ? "true" : "false");
        case dom::element_type::NULL_VALUE: return _sink.put("null");
        }
    }

private:
    void writeArray(const Value::Array& array)
    {
        writeContainer('[', ']', array, [this](const Value& element) { write(element); });
    }

    void writeDictionary(const Dictionary& dictionary)
    {
        writeContainer('{', '}', dictionary, [this](const Dictionary::Entry& entry) {
            writeKey(entry.first);
            write(entry.second);
        });
    }

    void writeKey(std::string_view key)
    {
        json::putString(_sink, key);
        _sink.put(_pretty ? std::string_view(": ") : std::string_view(":"));
    }

    template <class Container, class WriteOne>
    void writeContainer(char open, char close, const Container& container, WriteOne writeOne)
    {
        _sink.put(open);
        ++_depth;
        bool first = true;
        for (const auto& item : container) {
            if (!first) _sink.put(',');
            first = false;
            if (_pretty) newLine();
            writeOne(item);
        }
        --_depth;
        if (_pretty && !first) newLine();
        _sink.put(close);
    }

    void newLine()
    {
        _sink.put('\n');
        for (std::size_t i = 0; i < _depth; ++i) _sink.put("  ");
    }

    Sink& _sink;
    const bool _pretty;
    std::size_t _depth = 0;
};

} // namespace

struct JsonDocument::Parsed {
    std::unique_ptr<dom::parser> parser; ///< owns the document
    dom::element root;

    Parsed() : parser(keptParser ? std::move(keptParser) : std::make_unique<dom::parser>()) {}
    ~Parsed()
    {
        if (parser->capacity() <= kKeptParserCapacity) keptParser = std::move(parser);
    }
    Parsed(const Parsed&) = delete;
    Parsed& operator=(const Parsed&) = delete;
};

JsonDocument::JsonDocument(std::unique_ptr<Parsed> parsed) : _parsed(std::move(parsed)) {}
JsonDocument::JsonDocument(JsonDocument&&) noexcept = default;
JsonDocument& JsonDocument::operator=(JsonDocument&&) noexcept = default;
JsonDocument::~JsonDocument() = default;

std::expected<JsonDocument, Error> JsonDocument::parse(std::string_view text, std::size_t maximumSize,
                                                       std::size_t maximumValues)
{
    if (text.size() > maximumSize) return malformed(fmt::format("larger than {} bytes", maximumSize));
    if (mayHaveMoreValues(text, maximumValues)) return malformed(fmt::format("more than {} values", maximumValues));
    if (text.starts_with("\xef\xbb\xbf")) text.remove_prefix(3);

    auto parsed = std::make_unique<Parsed>();
    auto error = parseBounded(*parsed->parser, text, parsed->root);
    if (error == simdjson::NUMBER_ERROR || error == simdjson::STRING_ERROR)
        error = parseBounded(*parsed->parser, mended(text), parsed->root);
    if (error == simdjson::DEPTH_ERROR) return malformed(fmt::format("nested deeper than {}", kMaximumDepth));
    if (error) return malformed(simdjson::error_message(error));
    return JsonDocument(std::move(parsed));
}

struct JsonView::Access {
    static JsonView viewOf(dom::element element)
    {
        JsonView view;
        view._place = std::bit_cast<decltype(view._place)>(element);
        return view;
    }
    /// Returns what `view` refers to if it is a T.
    template <class T> static std::optional<T> get(const JsonView& view)
    {
        T value;
        const bool exists = view._place[0] != 0;
        return exists && elementOf(view).get(value) == simdjson::SUCCESS ? std::optional(value) : std::nullopt;
    }
    static dom::element elementOf(const JsonView& view) { return std::bit_cast<dom::element>(view._place); }
};

JsonView JsonDocument::root() const
{
    return JsonView::Access::viewOf(_parsed->root);
}

bool JsonView::isArray() const
{
    return Access::get<dom::array>(*this).has_value();
}

bool JsonView::isDictionary() const
{
    return Access::get<dom::object>(*this).has_value();
}

std::optional<std::string_view> JsonView::asString() const
{
    return Access::get<std::string_view>(*this);
}

JsonView JsonView::operator[](std::string_view key) const
{
    JsonView last;
    if (const auto object = Access::get<dom::object>(*this))
        for (const auto& [name, element] : *object)
            if (name == key) last = Access::viewOf(element);
    return last;
}

bool JsonView::has(std::string_view key) const
{
    return (*this)[key]._place[0] != 0;
}

std::vector<JsonView> JsonView::elements() const
{
    std::vector<JsonView> elements;
    if (const auto array = Access::get<dom::array>(*this)) {
        elements.reserve(array->size());
        for (const dom::element element : *array) elements.push_back(Access::viewOf(element));
    }
    return elements;
}

std::vector<std::pair<std::string_view, JsonView>> JsonView::containers() const
{
    std::vector<std::pair<std::string_view, JsonView>> containers;
    const auto add = [&containers](std::string_view key, dom::element element) {
        if (isContainer(element)) containers.emplace_back(key, Access::viewOf(element));
    };
    if (const auto array = Access::get<dom::array>(*this))
        for (const dom::element element : *array) add("", element);
    const auto object = Access::get<dom::object>(*this);
    if (object && std::ranges::any_of(*object, [](const auto& entry) { return isContainer(entry.value); }))
        for (const auto& [key, element] : entriesOf(*object)) add(key, element);
    return containers;
}

void JsonView::eachEntry(const std::function<void(std::string_view, JsonView)>& take) const
{
    if (const auto object = Access::get<dom::object>(*this))
        for (const auto& [key, element] : *object) take(key, Access::viewOf(element));
}

Value JsonView::value() const
{
    return _place[0] != 0 ? convert(Access::elementOf(*this)) : Value();
}

std::string JsonView::json() const
{
    if (_place[0] == 0) return "null";
    TextSink sink;
    JsonWriter(sink, JsonStyle::Compact).write(Access::elementOf(*this));
    return std::move(sink.text);
}

std::expected<Value, Error> parseJson(std::string_view text, std::size_t maximumSize)
{
    auto document = JsonDocument::parse(text, maximumSize);
    if (!document) return std::unexpected(std::move(document.error()));
    return document->root().value();
}

std::string toJson(const Value& value, JsonStyle style)
{
    TextSink sink;
    JsonWriter(sink, style).write(value);
    return std::move(sink.text);
}

std::size_t jsonSize(const Value& value)
{
    CountingSink sink;
    JsonWriter(sink, JsonStyle::Compact).write(value);
    return sink.count;
}

} // namespace platform
