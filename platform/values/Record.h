#pragma once

#include <cstdint>
#include <limits>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/base/Uuid.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

/// Records are plain structs that list their fields once. Archives, IPC messages and tests use that list.
///
///     struct Suggestion : platform::RecordOf<Suggestion> {
///         static constexpr std::string_view kClass = "Suggestion";
///         std::optional<std::string> identifier;
///         double score = 0;
///         static constexpr auto fields()
///         {
///             return std::tuple{platform::field("id", &Suggestion::identifier),
///                               platform::field("score", &Suggestion::score)};
///         }
///     };
///
/// A field is a bool, an integer, an enumeration, a floating-point number, std::string, Uuid, Url, Bytes, Date, Value,
/// Error, a shared_ptr to a record, or an optional or vector of these.
///
/// Decoding checks types. A value of the wrong type, an unknown class, a record of a class other than the field's, and
/// a null in an array of records are errors that name the field. Unknown keys are skipped; the field of a missing key
/// keeps its initial value.
///
/// Records, encoders and decoders: one thread at a time.
namespace platform {

/// Receives the values of one record, in the order in which the record lists its fields.
class Encoder {
public:
    virtual ~Encoder() = default;
    virtual void beginRecord(std::string_view className, std::size_t fieldCount) = 0;
    virtual void key(std::string_view name) = 0;
    virtual void endRecord() = 0;
    virtual void beginArray(std::size_t count) = 0;
    virtual void endArray() = 0;
    virtual void null() = 0;
    virtual void boolean(bool value) = 0;
    virtual void integer(std::int64_t value) = 0;
    virtual void unsignedInteger(std::uint64_t value) = 0;
    virtual void real(double value) = 0;
    virtual void string(std::string_view value) = 0;
    virtual void bytes(const Bytes& value) = 0;
    virtual void date(Date value) = 0;
    virtual void value(const Value& value) = 0;
};

class RecordClasses;

/// The key of a record's class name in archives and in IPC dictionaries.
inline constexpr std::string_view kClassKey = "class";

/// Reads the values of a record. Each read consumes the next value and fails if it is of another type. After the first
/// failure all reads return zero or an empty value, so that callers check once, at the end.
class Decoder {
public:
    /// `classes` must outlive the decoder.
    explicit Decoder(const RecordClasses& classes) : _classes(classes) {}
    virtual ~Decoder() = default;

    /// If the next value is null, consumes it and returns true; otherwise consumes nothing.
    virtual bool null() = 0;
    virtual bool boolean() = 0;
    virtual std::int64_t integer() = 0;
    virtual std::uint64_t unsignedInteger() = 0;
    virtual double real() = 0;
    /// The text is valid as long as the input.
    virtual std::string_view string() = 0;
    virtual Bytes bytes() = 0;
    virtual Date date() = 0;
    virtual Value value() = 0;
    virtual void skip() = 0;
    /// Returns true if the next value is a record; a dictionary without a class is not one. Consumes nothing.
    virtual bool isRecord() = 0;
    /// Enters a record and returns its class name, which is valid as long as the input. Call `nextKey` until it returns
    /// false.
    virtual std::string_view beginRecord() = 0;
    /// Moves to the next field and sets `name`, which is valid as long as the input. At the end, leaves the record and
    /// returns false.
    virtual bool nextKey(std::string_view& name) = 0;
    /// Enters an array and returns the number of elements for which memory may safely be reserved; 0 if it is unknown.
    /// Call `nextElement` until it returns false.
    virtual std::size_t beginArray() = 0;
    /// Moves to the next element. At the end, leaves the array and returns false.
    virtual bool nextElement() = 0;

    /// Records the first failure; ignores later ones.
    void fail(std::string reason, std::int64_t code = kMalformed);
    [[nodiscard]] bool failed() const { return _failure.has_value(); }
    /// Prepends a field or an index to the path of the failure. Each caller calls it on the way out, innermost first.
    void failedIn(std::string_view field);
    void failedIn(std::size_t index);
    /// Returns the failure, or nothing. Its reason begins with the path: "results[2].score: expected a double, …".
    [[nodiscard]] std::optional<Error> error() const;
    [[nodiscard]] const RecordClasses& classes() const { return _classes; }

    /// Codes of kFormatErrorDomain.
    static constexpr std::int64_t kMalformed = kFormatMalformed;
    static constexpr std::int64_t kUnknownClass = kFormatUnknownClass;

protected:
    /// Fails because the next value is of type `found` instead of `expected` ("an integer").
    void failExpecting(std::string_view expected, Value::Type found);

private:
    struct Failure {
        std::string place; ///< path to the value, built from its end
        std::string reason;
        std::int64_t code;
    };
    const RecordClasses& _classes;
    std::optional<Failure> _failure;
};

class Record;

/// What archives may hold for a field: the field's C++ type, for readers that build no record.
struct FieldShape {
    enum class Kind : std::uint8_t { Bool, Integer, Unsigned, Real, Text, Bytes, Date, Value, Error, Record, Array };
    Kind kind{};
    std::int64_t minimum = 0; ///< of an integer
    std::uint64_t maximum = 0;
    bool (*accepts)(std::string_view text) = nullptr; ///< whether a text fits; null if all do
    bool (*isA)(const Record* record) = nullptr;      ///< whether a record's class fits
    const FieldShape* element = nullptr;              ///< of an array
};

/// Base of every record. Derive from `RecordOf`, which implements these functions.
class Record {
public:
    virtual ~Record() = default;
    [[nodiscard]] virtual std::string_view className() const = 0;
    [[nodiscard]] virtual std::size_t fieldCount() const { return 0; }
    virtual void encodeFields(Encoder&) const {}
    /// Reads the value of `key`; returns false and consumes nothing if the record has no such field. Fields usually
    /// come in the order of the list, so the search begins at index `next`, which is set to the one after the field
    /// found.
    virtual bool decodeField(std::string_view key, Decoder& decoder, std::size_t& next);

    /// One field of a class.
    struct FieldReader {
        std::string_view name;
        void (*read)(Record&, Decoder&); ///< into a record of the class
        const FieldShape* shape;
    };
    /// Returns all fields in order, those of the base first.
    [[nodiscard]] virtual std::span<const FieldReader> fieldReaders() const { return {}; }
    /// Returns the same fields as a tuple of `Field`.
    static constexpr auto allFields() { return std::tuple<>(); }
};

template <class Owner, class Member> struct Field {
    std::string_view name;
    Member Owner::* member;
};
template <class Owner, class Member> constexpr Field<Owner, Member> field(std::string_view name, Member Owner::* member)
{
    return {name, member};
}

/// A record class that a decoder accepts.
struct RecordClass {
    std::shared_ptr<Record> (*make)();
    std::shared_ptr<const Record> prototype; ///< with the initial values of all fields
    std::span<const Record::FieldReader> fields;

    [[nodiscard]] std::shared_ptr<Record> operator()() const { return make(); }
};

/// The record classes that a decoder accepts, by name. Fill it on one thread; then any thread may read it.
class RecordClasses {
public:
    template <class T> void add()
    {
        auto prototype = std::make_shared<const T>();
        const auto fields = static_cast<const Record&>(*prototype).fieldReaders();
        _classes[T::kClass] = {.make = []() -> std::shared_ptr<Record> { return std::make_shared<T>(); },
                               .prototype = std::move(prototype),
                               .fields = fields};
    }
    template <class... T> [[nodiscard]] static RecordClasses of()
    {
        RecordClasses classes;
        (classes.add<T>(), ...);
        return classes;
    }
    void addAll(const RecordClasses& other) { _classes.insert(other._classes.begin(), other._classes.end()); }
    /// Returns a class, or null for an unknown name. Valid until a class is added.
    [[nodiscard]] const RecordClass* find(std::string_view className) const
    {
        const auto found = _classes.find(className);
        return found == _classes.end() ? nullptr : &found->second;
    }
    /// Returns a new record, or null for an unknown name.
    [[nodiscard]] std::shared_ptr<Record> make(std::string_view className) const
    {
        const RecordClass* found = find(className);
        return found ? found->make() : nullptr;
    }
    [[nodiscard]] auto begin() const { return _classes.begin(); }
    [[nodiscard]] auto end() const { return _classes.end(); }

private:
    std::unordered_map<std::string_view, RecordClass> _classes;
};

void encodeRecord(Encoder& encoder, const Record& record);

/// Reads a record of any known class. Returns null after a failure; an unknown class is one.
[[nodiscard]] std::shared_ptr<Record> decodeRecord(Decoder& decoder);
/// Reads the next value if it is a record of a known class and `wanted`, called with an empty record of that class,
/// returns true. Otherwise skips the value and returns null; that is not a failure.
[[nodiscard]] std::shared_ptr<Record> decodeRecordIf(Decoder& decoder, bool (*wanted)(const Record&));
/// Likewise for the class `T` and classes derived from it.
template <class T> [[nodiscard]] std::shared_ptr<T> decodeRecordIfA(Decoder& decoder)
{
    const auto isA = [](const Record& record) { return dynamic_cast<const T*>(&record) != nullptr; };
    return std::dynamic_pointer_cast<T>(decodeRecordIf(decoder, isA));
}

/// Returns the error that a field of type Error is encoded as; nothing if an entry is of the wrong type. Missing
/// entries read as empty.
[[nodiscard]] std::optional<Error> errorFromDictionary(const Value& value);

namespace detail {

template <class T> struct IsOptional : std::false_type {};
template <class T> struct IsOptional<std::optional<T>> : std::true_type {};
template <class T> struct IsVector : std::false_type {};
template <class T> struct IsVector<std::vector<T>> : std::true_type {};
template <class T> struct IsShared : std::false_type {};
template <class T> struct IsShared<std::shared_ptr<T>> : std::true_type {};

template <class T> consteval FieldShape shapeOf();
template <class T> inline constexpr FieldShape kShape = shapeOf<T>();

void encodeError(Encoder& encoder, const Error& error);
[[nodiscard]] Error decodeError(Decoder& decoder);

template <class T> void encodeValue(Encoder& encoder, const T& value)
{
    if constexpr (std::is_same_v<T, bool>)
        encoder.boolean(value);
    else if constexpr (std::is_enum_v<T>)
        encodeValue(encoder, static_cast<std::underlying_type_t<T>>(value));
    else if constexpr (std::is_integral_v<T> && std::is_signed_v<T>)
        encoder.integer(value);
    else if constexpr (std::is_integral_v<T>)
        encoder.unsignedInteger(value);
    else if constexpr (std::is_floating_point_v<T>)
        encoder.real(value);
    else if constexpr (std::is_same_v<T, std::string>)
        encoder.string(value);
    else if constexpr (std::is_same_v<T, Bytes>)
        encoder.bytes(value);
    else if constexpr (std::is_same_v<T, Date>)
        encoder.date(value);
    else if constexpr (std::is_same_v<T, Value>)
        encoder.value(value);
    else if constexpr (std::is_same_v<T, Error>)
        encodeError(encoder, value);
    else if constexpr (std::is_same_v<T, Uuid>)
        value.isNil() ? encoder.null() : encoder.string(value.string());
    else if constexpr (IsOptional<T>::value)
        value ? encodeValue(encoder, *value) : encoder.null();
    else if constexpr (IsShared<T>::value)
        value ? encodeRecord(encoder, *value) : encoder.null();
    else if constexpr (IsVector<T>::value) {
        encoder.beginArray(value.size());
        for (const auto& element : value) encodeValue(encoder, element);
        encoder.endArray();
    } else
        encoder.string(value.string()); // Url
}

template <class T> void decodeValue(Decoder& decoder, T& value)
{
    if constexpr (IsOptional<T>::value) {
        if (decoder.null()) return value.reset();
        typename T::value_type inner{};
        decodeValue(decoder, inner);
        value = std::move(inner);
    } else if constexpr (std::is_same_v<T, Value>)
        value = decoder.value();
    else if (decoder.null())
        value = T{};
    else if constexpr (std::is_same_v<T, bool>)
        value = decoder.boolean();
    else if constexpr (std::is_enum_v<T>) {
        std::underlying_type_t<T> number{};
        decodeValue(decoder, number);
        value = static_cast<T>(number);
    } else if constexpr (std::is_integral_v<T> && std::is_signed_v<T>) {
        const std::int64_t number = decoder.integer();
        value = static_cast<T>(number);
        if (value != number) decoder.fail("number out of range");
    } else if constexpr (std::is_integral_v<T>) {
        const std::uint64_t number = decoder.unsignedInteger();
        value = static_cast<T>(number);
        if (value != number) decoder.fail("number out of range");
    } else if constexpr (std::is_floating_point_v<T>)
        value = static_cast<T>(decoder.real());
    else if constexpr (std::is_same_v<T, std::string>)
        value = decoder.string();
    else if constexpr (std::is_same_v<T, Bytes>)
        value = decoder.bytes();
    else if constexpr (std::is_same_v<T, Date>)
        value = decoder.date();
    else if constexpr (std::is_same_v<T, Error>)
        value = decodeError(decoder);
    else if constexpr (std::is_same_v<T, Uuid>) {
        if (auto uuid = Uuid::parse(decoder.string()))
            value = *uuid;
        else
            decoder.fail("not a UUID");
    } else if constexpr (IsShared<T>::value) {
        using R = typename T::element_type;
        auto record = decodeRecord(decoder);
        value = std::dynamic_pointer_cast<R>(record);
        if (record && !value) decoder.fail("unexpected class " + std::string(record->className()));
    } else if constexpr (IsVector<T>::value) {
        value.clear();
        value.reserve(decoder.beginArray());
        while (decoder.nextElement()) {
            decodeValue(decoder, value.emplace_back());
            if constexpr (IsShared<typename T::value_type>::value) {
                if (!value.back()) decoder.fail("missing record");
            }
            if (decoder.failed()) return decoder.failedIn(value.size() - 1);
        }
    } else { // Url
        auto url = T::parse(decoder.string());
        if (url)
            value = std::move(*url);
        else
            decoder.fail("not a URL");
    }
}

template <class T> consteval FieldShape shapeOf()
{
    using Kind = FieldShape::Kind;
    if constexpr (IsOptional<T>::value)
        return shapeOf<typename T::value_type>();
    else if constexpr (std::is_enum_v<T>)
        return shapeOf<std::underlying_type_t<T>>();
    else if constexpr (std::is_same_v<T, bool>)
        return {.kind = Kind::Bool};
    else if constexpr (std::is_integral_v<T>)
        return {.kind = std::is_signed_v<T> ? Kind::Integer : Kind::Unsigned,
                .minimum = static_cast<std::int64_t>(std::numeric_limits<T>::min()),
                .maximum = static_cast<std::uint64_t>(std::numeric_limits<T>::max())};
    else if constexpr (std::is_floating_point_v<T>)
        return {.kind = Kind::Real};
    else if constexpr (std::is_same_v<T, std::string>)
        return {.kind = Kind::Text};
    else if constexpr (std::is_same_v<T, Bytes>)
        return {.kind = Kind::Bytes};
    else if constexpr (std::is_same_v<T, Date>)
        return {.kind = Kind::Date};
    else if constexpr (std::is_same_v<T, Value>)
        return {.kind = Kind::Value};
    else if constexpr (std::is_same_v<T, Error>)
        return {.kind = Kind::Error};
    else if constexpr (IsShared<T>::value)
        return {.kind = Kind::Record, .isA = [](const Record* record) {
                    return dynamic_cast<const typename T::element_type*>(record) != nullptr;
                }};
    else if constexpr (IsVector<T>::value)
        return {.kind = Kind::Array, .element = &kShape<typename T::value_type>};
    else // Uuid, Url
        return {.kind = Kind::Text, .accepts = [](std::string_view text) { return T::parse(text).has_value(); }};
}

} // namespace detail

/// Base of a record `Self` that adds fields to the record `Base`; see the top of this file.
template <class Self, class Base = Record> class RecordOf : public Base {
public:
    using Base::Base;

    static constexpr auto allFields() { return std::tuple_cat(Base::allFields(), Self::fields()); }

    [[nodiscard]] std::string_view className() const override { return Self::kClass; }

    [[nodiscard]] std::size_t fieldCount() const override
    {
        return Base::fieldCount() + std::tuple_size_v<decltype(Self::fields())>;
    }

    void encodeFields(Encoder& encoder) const override
    {
        Base::encodeFields(encoder);
        const auto& self = static_cast<const Self&>(*this);
        std::apply(
            [&](const auto&... f) { ((encoder.key(f.name), detail::encodeValue(encoder, self.*(f.member))), ...); },
            Self::fields());
    }

    [[nodiscard]] std::span<const Record::FieldReader> fieldReaders() const override
    {
        static const std::vector<Record::FieldReader> readers = [this] {
            const auto inherited = Base::fieldReaders();
            std::vector<Record::FieldReader> all(inherited.begin(), inherited.end());
            [&all]<std::size_t... I>(std::index_sequence<I...>) {
                (all.push_back({std::get<I>(Self::fields()).name, readField<I>, shape<I>()}), ...);
            }(std::make_index_sequence<std::tuple_size_v<decltype(Self::fields())>>());
            return all;
        }();
        return readers;
    }

private:
    template <std::size_t I> static const FieldShape* shape()
    {
        constexpr auto member = std::get<I>(Self::fields()).member;
        return &detail::kShape<std::remove_cvref_t<decltype(std::declval<Self&>().*member)>>;
    }
    template <std::size_t I> static void readField(Record& record, Decoder& decoder)
    {
        constexpr auto member = std::get<I>(Self::fields()).member;
        detail::decodeValue(decoder, static_cast<Self&>(record).*member);
    }
};

/// Casts a decoded record to `T`; returns an error if it is of another class. Passes null and an error on.
template <class T> [[nodiscard]] Result<std::shared_ptr<T>> castRecord(Result<std::shared_ptr<Record>> record)
{
    if (!record) return std::unexpected(std::move(record.error()));
    if (!*record) return nullptr;
    if (auto cast = std::dynamic_pointer_cast<T>(*record)) return cast;
    return std::unexpected(Error::withReason(kFormatErrorDomain, Decoder::kUnknownClass,
                                             "unexpected class " + std::string((*record)->className())));
}

} // namespace platform
