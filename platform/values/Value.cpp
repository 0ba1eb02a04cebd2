#include "platform/values/Value.h"

#include <array>

#include "platform/values/Dictionary.h"

namespace platform {

namespace {

constinit const Value kNull;

/// Destroying a container recurses into its contents. Containers nested deeper than this are put on a list and
/// destroyed later, so that no depth of nesting exhausts the stack.
constexpr unsigned kMaximumNestedDestruction = 128;
constinit thread_local unsigned nestedDestructions = 0;
constinit thread_local std::vector<Value>* waitingForDestruction = nullptr;

/// Makes `shared` the only owner of its contents: copies them if there are other owners.
template <class T> T& makeUnique(std::shared_ptr<T>& shared)
{
    if (shared.use_count() > 1) shared = std::make_shared<T>(*shared);
    // The increment orders our writes after the reads of another thread that has just released its reference.
    else
        const std::shared_ptr<T> ordered(shared);
    return *shared;
}

/// Returns `d` as an `I` if it is a whole number, at least `lowest` and less than `limit`.
template <class I> std::optional<I> wholeNumber(double d, double lowest, double limit)
{
    if (!(d >= lowest && d < limit)) return std::nullopt;
    const I whole = static_cast<I>(d);
    if (static_cast<double>(whole) != d) return std::nullopt;
    return whole;
}

constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

} // namespace

Value::Value(std::string s) : _storage(std::make_shared<std::string>(std::move(s))) {}
Value::Value(platform::Bytes bytes) : _storage(std::make_shared<platform::Bytes>(std::move(bytes))) {}
Value::Value(Array array) : _storage(std::make_shared<Array>(std::move(array))) {}
Value::Value(Dictionary dictionary) : _storage(std::make_shared<Dictionary>(std::move(dictionary))) {}

Value& Value::operator=(const Value& other)
{
    return *this = Value(other);
}

Value& Value::operator=(Value&& other) noexcept
{
    // Destroys the old contents last: `other` may be part of them.
    Value taken(std::move(other));
    _storage.swap(taken._storage);
    return *this;
}

Value::~Value()
{
    if (type() < Type::Array) return;
    if (nestedDestructions == kMaximumNestedDestruction) {
        if (!waitingForDestruction) waitingForDestruction = new std::vector<Value>;
        waitingForDestruction->push_back(std::move(*this));
        return;
    }
    ++nestedDestructions;
    _storage = std::monostate();
    if (nestedDestructions == 1) {
        while (waitingForDestruction) {
            const std::unique_ptr<std::vector<Value>> waiting(std::exchange(waitingForDestruction, nullptr));
        }
    }
    --nestedDestructions;
}

Value Value::dictionaryOf(std::initializer_list<std::pair<std::string, Value>> entries)
{
    return Dictionary(entries);
}

bool Value::isNumber() const
{
    return type() == Type::Int || type() == Type::UInt || type() == Type::Double;
}

std::optional<bool> Value::asBool() const
{
    if (const bool* b = std::get_if<bool>(&_storage)) return *b;
    return std::nullopt;
}

std::optional<std::int64_t> Value::asInt() const
{
    if (const auto* i = std::get_if<std::int64_t>(&_storage)) return *i;
    if (const auto* d = std::get_if<double>(&_storage)) return wholeNumber<std::int64_t>(*d, -kTwoTo63, kTwoTo63);
    return std::nullopt;
}

std::optional<std::uint64_t> Value::asUInt() const
{
    if (const auto* u = std::get_if<std::uint64_t>(&_storage)) return *u;
    if (const auto* i = std::get_if<std::int64_t>(&_storage); i && *i >= 0) return static_cast<std::uint64_t>(*i);
    if (const auto* d = std::get_if<double>(&_storage)) return wholeNumber<std::uint64_t>(*d, 0, kTwoTo64);
    return std::nullopt;
}

std::optional<double> Value::asDouble() const
{
    if (const auto* d = std::get_if<double>(&_storage)) return *d;
    if (const auto* i = std::get_if<std::int64_t>(&_storage)) return static_cast<double>(*i);
    if (const auto* u = std::get_if<std::uint64_t>(&_storage)) return static_cast<double>(*u);
    return std::nullopt;
}

const std::string* Value::asString() const
{
    const auto* shared = std::get_if<Shared<std::string>>(&_storage);
    return shared ? shared->get() : nullptr;
}

const platform::Bytes* Value::asBytes() const
{
    const auto* shared = std::get_if<Shared<platform::Bytes>>(&_storage);
    return shared ? shared->get() : nullptr;
}

std::optional<platform::Date> Value::asDate() const
{
    if (const auto* date = std::get_if<platform::Date>(&_storage)) return *date;
    return std::nullopt;
}

const Value::Array* Value::asArray() const
{
    const auto* shared = std::get_if<Shared<Array>>(&_storage);
    return shared ? shared->get() : nullptr;
}

const Dictionary* Value::asDictionary() const
{
    const auto* shared = std::get_if<Shared<Dictionary>>(&_storage);
    return shared ? shared->get() : nullptr;
}

const Value& Value::operator[](std::string_view key) const
{
    const Dictionary* dictionary = asDictionary();
    const Value* found = dictionary ? dictionary->find(key) : nullptr;
    return found ? *found : kNull;
}

const Value& Value::element(std::size_t index) const
{
    const Array* array = asArray();
    return array && index < array->size() ? (*array)[index] : kNull;
}

std::size_t Value::count() const
{
    if (const Array* array = asArray()) return array->size();
    if (const Dictionary* dictionary = asDictionary()) return dictionary->size();
    return 0;
}

Value::Array& Value::mutableArray()
{
    if (type() != Type::Array) *this = Value(Array());
    return makeUnique(std::get<Shared<Array>>(_storage));
}

Dictionary& Value::mutableDictionary()
{
    if (type() != Type::Dictionary) *this = Value(Dictionary());
    return makeUnique(std::get<Shared<Dictionary>>(_storage));
}

bool operator==(const Value& a, const Value& b)
{
    // Numbers that fit are stored as signed, so a signed and an unsigned one are never equal.
    if (a._storage.index() != b._storage.index()) return false;
    return std::visit(
        [&b]<class T>(const T& mine) {
            const T& other = std::get<T>(b._storage);
            if constexpr (requires { mine.get(); })
                return mine == other || *mine == *other;
            else
                return mine == other;
        },
        a._storage);
}

std::string_view typeName(Value::Type type)
{
    static constexpr std::array<std::string_view, 10> kNames{"null",   "bool",  "integer", "integer", "double",
                                                             "string", "bytes", "date",    "array",   "dictionary"};
    return kNames[static_cast<std::size_t>(type)];
}

} // namespace platform
