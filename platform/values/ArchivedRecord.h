#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <tuple>
#include <type_traits>
#include <vector>

#include "platform/values/ArchiveTokens.h"
#include "platform/values/Record.h"

/// Reads records in place: texts stay in the archive, and no record is built.
///
///     OpenArchive archive(classes);
///     if (!archive.open(bytes)) …                               // not in the form that `archive` writes
///     if (auto suggestion = archive.root().as<Suggestion>())
///         print(suggestion["score"_field]);                     // checked when it is compiled
///
/// What `OpenArchive` gives out is valid until it opens another archive, and as long as the archive's bytes. One thread
/// at a time.
namespace platform {

class OpenArchive;
class JsonSink;

/// The name of a record's field: "score"_field.
template <std::size_t Size> struct FieldNameText {
    consteval FieldNameText(const char (&literal)[Size])
    {
        for (std::size_t i = 0; i < Size; ++i) text[i] = literal[i];
    }
    char text[Size];
};
template <FieldNameText name> struct FieldName {
    static constexpr std::string_view kText{name.text, sizeof(name.text) - 1};
};
template <FieldNameText name> constexpr FieldName<name> operator""_field()
{
    return {};
}

/// A plain value in an archive: what a field of type `Value` holds. Null if the field is missing.
class ArchivedValue {
public:
    ArchivedValue() = default;
    ArchivedValue(const OpenArchive& archive, std::uint32_t node) : _archive(&archive), _node(node) {}

    [[nodiscard]] Value::Type type() const;
    [[nodiscard]] bool isNull() const { return type() == Value::Type::Null; }
    /// Builds the value.
    [[nodiscard]] Value value() const;
    /// Writes the value, like that of `value()`: the last of duplicate keys wins.
    void write(JsonSink& sink) const;
    /// Calls `take` with each key and value of a dictionary, duplicate keys included; not at all for another value.
    template <class Take> void forEachEntry(Take take) const;

private:
    template <class Take> void forEach(Take take) const;
    /// Returns whether two entries have the same key; true for a large dictionary, which is not searched.
    [[nodiscard]] bool hasDuplicateKeys() const;

    const OpenArchive* _archive = nullptr;
    std::uint32_t _node = 0;
};

/// A record in an archive, or null. `R` is its class or a base of it.
template <class R> class ArchivedRecord {
public:
    ArchivedRecord() = default;
    ArchivedRecord(const OpenArchive& archive, std::uint32_t node) : _archive(&archive), _node(node) {}

    explicit operator bool() const { return _archive != nullptr; }
    /// Returns the value of a field: numbers and enumerations as they are, texts as views, records as
    /// `ArchivedRecord`, arrays as `ArchivedArray`, others as `ArchivedValue`. A missing field has its initial value,
    /// as in every field of null.
    template <FieldNameText name> [[nodiscard]] auto operator[](FieldName<name>) const;
    /// Returns the same record as a `T`; null if it is none.
    template <class T> [[nodiscard]] ArchivedRecord<T> as() const;
    [[nodiscard]] std::string_view className() const;
    /// Returns the record's own archive.
    [[nodiscard]] std::string_view bytes() const;

private:
    const OpenArchive* _archive = nullptr;
    std::uint32_t _node = 0;
};

/// An array in an archive, where the record has a `std::vector<T>`.
template <class T> class ArchivedArray {
public:
    ArchivedArray() = default;
    ArchivedArray(const OpenArchive& archive, std::uint32_t node);

    class Iterator {
    public:
        Iterator(const OpenArchive* archive, std::uint32_t node) : _archive(archive), _node(node) {}
        [[nodiscard]] auto operator*() const;
        Iterator& operator++();
        [[nodiscard]] bool operator==(const Iterator& other) const { return _node == other._node; }

    private:
        const OpenArchive* _archive;
        std::uint32_t _node;
    };
    [[nodiscard]] Iterator begin() const { return {_archive, _begin}; }
    [[nodiscard]] Iterator end() const { return {_archive, _end}; }
    [[nodiscard]] bool empty() const { return _begin == _end; }
    /// Returns the first element. There must be one.
    [[nodiscard]] auto front() const { return *begin(); }

private:
    const OpenArchive* _archive = nullptr;
    std::uint32_t _begin = 0;
    std::uint32_t _end = 0;
};

/// Checks an archive against the fields of its classes, and finds its values. Reuse one for many archives.
class OpenArchive {
public:
    /// `classes` must outlive it.
    explicit OpenArchive(const RecordClasses& classes) : _classes(classes) {}
    OpenArchive(const OpenArchive&) = delete;
    OpenArchive& operator=(const OpenArchive&) = delete;

    /// Opens the archive of a record. Returns false unless it is as `archive` writes it: `unarchive` accepts it, and
    /// each record has known fields only, in their order, and no null. An archive that `unarchive` alone accepts can be
    /// opened after `archive` has written its record again.
    [[nodiscard]] bool open(std::string_view archive);
    /// Returns the record of the archive.
    [[nodiscard]] ArchivedRecord<Record> root() const { return {*this, 0}; }

private:
    friend class ArchivedValue;
    template <class R> friend class ArchivedRecord;
    template <class T> friend class ArchivedArray;
    class Parser;

    /// A value. Those of a container follow it; the token of a record has its index instead of a size.
    struct Node {
        archives::Token token;
        std::uint32_t next; ///< the node after this value
    };
    struct OpenRecord {
        const RecordClass* recordClass;
        std::uint32_t fields;     ///< the index of the first field
        std::uint32_t begin, end; ///< in the archive
    };

    [[nodiscard]] const OpenRecord& record(std::uint32_t node) const { return _records[_nodes[node].token.size]; }
    template <class T> [[nodiscard]] auto read(std::uint32_t node) const;

    const RecordClasses& _classes;
    std::string_view _archive;
    std::vector<Node> _nodes;
    std::vector<OpenRecord> _records;
    std::vector<std::uint32_t> _fields; ///< the nodes of all records' fields; 0 for a missing one

    /// A class that was found for a field, so that the next record of that class needs no look-up.
    struct Found {
        std::string_view name;
        bool (*isA)(const Record*) = nullptr;
        const RecordClass* recordClass = nullptr;
    };
    std::array<Found, 32> _found; ///< by length and letters of the name
};

template <class T> auto OpenArchive::read(std::uint32_t index) const
{
    using detail::IsOptional;
    using detail::IsShared;
    using detail::IsVector;
    const archives::Token& token = _nodes[index].token;
    if constexpr (IsOptional<T>::value)
        return std::optional(read<typename T::value_type>(index));
    else if constexpr (std::is_same_v<T, bool>)
        return token.boolean;
    else if constexpr (std::is_enum_v<T> || std::is_integral_v<T>)
        return static_cast<T>(token.integer);
    else if constexpr (std::is_floating_point_v<T>)
        return static_cast<T>(token.real);
    else if constexpr (std::is_same_v<T, std::string>)
        return token.text();
    else if constexpr (IsShared<T>::value)
        return ArchivedRecord<typename T::element_type>(*this, index);
    else if constexpr (IsVector<T>::value)
        return ArchivedArray<typename T::value_type>(*this, index);
    else
        return ArchivedValue(*this, index);
}

namespace detail {

/// Returns the index of a field in `R::allFields()`.
template <class R> consteval std::size_t indexOfField(std::string_view name)
{
    return std::apply(
        [name](const auto&... fields) {
            std::size_t index = 0;
            const bool found = ((fields.name == name || (++index, false)) || ...);
            if (!found) throw "the record has no such field"; // makes the constant expression invalid
            return index;
        },
        R::allFields());
}

} // namespace detail

template <class Take> void ArchivedValue::forEachEntry(Take take) const
{
    if (type() != Value::Type::Dictionary) return;
    const auto& nodes = _archive->_nodes;
    for (std::uint32_t key = _node + 1; key != nodes[_node].next; key = nodes[key + 1].next)
        take(nodes[key].token.text(), ArchivedValue(*_archive, key + 1));
}

template <class Take> void ArchivedValue::forEach(Take take) const
{
    const auto& nodes = _archive->_nodes;
    for (std::uint32_t element = _node + 1; element != nodes[_node].next; element = nodes[element].next)
        take(ArchivedValue(*_archive, element));
}

template <class R> template <FieldNameText name> auto ArchivedRecord<R>::operator[](FieldName<name>) const
{
    constexpr std::size_t kIndex = detail::indexOfField<R>(FieldName<name>::kText);
    constexpr auto kMember = std::get<kIndex>(R::allFields()).member;
    using T = std::remove_cvref_t<decltype(std::declval<const R&>().*kMember)>;
    const std::uint32_t node = _archive ? _archive->_fields[_archive->record(_node).fields + kIndex] : 0;
    if (node != 0) return _archive->template read<T>(node);
    if constexpr (std::is_arithmetic_v<T> || std::is_enum_v<T>) {
        static const R kInitial;
        return kInitial.*kMember;
    } else {
        return decltype(_archive->template read<T>(node))();
    }
}

template <class R> template <class T> ArchivedRecord<T> ArchivedRecord<R>::as() const
{
    if (!_archive || !dynamic_cast<const T*>(_archive->record(_node).recordClass->prototype.get())) return {};
    return {*_archive, _node};
}

template <class R> std::string_view ArchivedRecord<R>::className() const
{
    return _archive ? _archive->record(_node).recordClass->prototype->className() : std::string_view();
}

template <class R> std::string_view ArchivedRecord<R>::bytes() const
{
    if (!_archive) return {};
    const auto& record = _archive->record(_node);
    return _archive->_archive.substr(record.begin, record.end - record.begin);
}

template <class T>
ArchivedArray<T>::ArchivedArray(const OpenArchive& archive, std::uint32_t node)
    : _archive(&archive), _begin(node + 1), _end(archive._nodes[node].next)
{}

template <class T> auto ArchivedArray<T>::Iterator::operator*() const
{
    return _archive->template read<T>(_node);
}

template <class T> typename ArchivedArray<T>::Iterator& ArchivedArray<T>::Iterator::operator++()
{
    _node = _archive->_nodes[_node].next;
    return *this;
}

} // namespace platform
