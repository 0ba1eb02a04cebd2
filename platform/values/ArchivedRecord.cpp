#include "platform/values/ArchivedRecord.h"

#include <algorithm>
#include <array>

#include "platform/values/Dictionary.h"
#include "platform/values/JsonSink.h"

namespace platform {

/// Reads one archive into the tables of an `OpenArchive`. Every function returns false if the archive is not as
/// `archive` writes it.
class OpenArchive::Parser {
public:
    explicit Parser(OpenArchive& to) : _to(to), _tokens(to._archive) {}

    bool parse() { return record(nullptr) && _tokens.atEnd(); }

private:
    using Kind = FieldShape::Kind;
    using Token = archives::Token;

    [[gnu::always_inline]] std::size_t add(const Token& token)
    {
        const std::size_t index = _to._nodes.size();
        _to._nodes.push_back({.token = token, .next = static_cast<std::uint32_t>(index + 1)});
        return index;
    }
    /// Notes the end of a container.
    bool end(std::size_t node)
    {
        _to._nodes[node].next = static_cast<std::uint32_t>(_to._nodes.size());
        return true;
    }

    bool record(bool (*isA)(const Record*))
    {
        const char* const begin = _tokens.position();
        Token head;
        std::string_view text;
        if (_tokens.read(head) || head.type != Value::Type::Dictionary || head.size == 0) return false;
        if (++_depth > kMaximumDepth || !readKey(text) || text != kClassKey || !readKey(text)) return false;
        const RecordClass* recordClass = find(text, isA);
        if (!recordClass) return false;

        const std::uint32_t entries = head.size;
        const std::size_t index = _to._records.size();
        const std::size_t fields = _to._fields.size();
        head.size = static_cast<std::uint32_t>(index);
        const std::size_t node = add(head);
        const auto offset = [this](const char* position) {
            return static_cast<std::uint32_t>(position - _to._archive.data());
        };
        _to._records.push_back({.recordClass = recordClass,
                                .fields = static_cast<std::uint32_t>(fields),
                                .begin = offset(begin),
                                .end = 0});
        _to._fields.resize(fields + recordClass->fields.size());
        auto field = recordClass->fields.begin();
        for (std::uint32_t i = 1; i < entries; ++i, ++field) {
            if (!readKey(text)) return false;
            while (field != recordClass->fields.end() && field->name != text) ++field;
            if (field == recordClass->fields.end()) return false;
            const auto position = static_cast<std::size_t>(field - recordClass->fields.begin());
            _to._fields[fields + position] = static_cast<std::uint32_t>(_to._nodes.size());
            if (!value(*field->shape)) return false;
        }
        _to._records[index].end = offset(_tokens.position());
        --_depth;
        return end(node);
    }

    /// Returns the class of that name if it fits the field; otherwise null.
    const RecordClass* find(std::string_view name, bool (*isA)(const Record*))
    {
        if (name.empty()) return nullptr;
        const std::size_t letters = static_cast<unsigned char>(name[name.size() / 2]) + name.size();
        Found& found = _to._found[letters % _to._found.size()];
        if (found.recordClass && found.isA == isA && found.name == name) return found.recordClass;
        const RecordClass* recordClass = _to._classes.find(name);
        if (!recordClass || (isA && !isA(recordClass->prototype.get()))) return nullptr;
        found = {.name = recordClass->prototype->className(), .isA = isA, .recordClass = recordClass};
        return recordClass;
    }

    bool readKey(std::string_view& text)
    {
        if (_tokens.readShortText(text)) return true;
        Token token;
        if (_tokens.read(token) || token.type != Value::Type::String) return false;
        text = token.text();
        return true;
    }

    bool value(const FieldShape& shape)
    {
        if (shape.kind == Kind::Record) return record(shape.isA);
        if (shape.kind == Kind::Value) return anyValue();
        if (shape.kind == Kind::Error) return error();
        Token token;
        if (_tokens.read(token)) return false;
        if (shape.kind == Kind::Array) return token.type == Value::Type::Array && array(token, *shape.element);
        if (!fits(token, shape)) return false;
        add(token);
        return true;
    }

    /// Returns whether a value without contents has the type of a field. Makes any number of a real field a double.
    static bool fits(Token& token, const FieldShape& shape)
    {
        using enum Value::Type;
        switch (shape.kind) {
        case Kind::Bool: return token.type == Bool;
        case Kind::Integer:
            return token.type == Int && token.integer >= shape.minimum &&
                   (token.integer < 0 || token.unsignedInteger <= shape.maximum);
        case Kind::Unsigned:
            return ((token.type == Int && token.integer >= 0) || token.type == UInt) &&
                   token.unsignedInteger <= shape.maximum;
        case Kind::Real:
            if (token.type == Int) token.real = static_cast<double>(token.integer);
            if (token.type == UInt) token.real = static_cast<double>(token.unsignedInteger);
            return token.type == Int || token.type == UInt || token.type == Double;
        case Kind::Text: return token.type == String && (!shape.accepts || shape.accepts(token.text()));
        case Kind::Bytes: return token.type == Bytes;
        case Kind::Date: return token.type == Date;
        default: return false;
        }
    }

    bool array(const Token& head, const FieldShape& element)
    {
        if (++_depth > kMaximumDepth) return false;
        const std::size_t node = add(head);
        for (std::uint32_t i = 0; i < head.size; ++i)
            if (!value(element)) return false;
        --_depth;
        return end(node);
    }

    bool error()
    {
        const auto node = static_cast<std::uint32_t>(_to._nodes.size());
        return anyValue() && errorFromDictionary(ArchivedValue(_to, node).value()).has_value();
    }

    /// Reads a value of any type. The keys of a dictionary are nodes, too.
    bool anyValue(std::size_t levels = kMaximumDepth)
    {
        Token head;
        if (_tokens.read(head)) return false;
        const std::size_t node = add(head);
        const bool hasKeys = head.type == Value::Type::Dictionary;
        if (!hasKeys && head.type != Value::Type::Array) return true;
        if (levels == 0) return false;
        for (std::uint32_t i = 0; i < head.size; ++i) {
            Token key;
            if (hasKeys && (_tokens.read(key) || key.type != Value::Type::String)) return false;
            if (hasKeys) add(key);
            if (!anyValue(levels - 1)) return false;
        }
        return end(node);
    }

    OpenArchive& _to;
    archives::TokenReader _tokens;
    std::size_t _depth = 0;
};

bool OpenArchive::open(std::string_view archive)
{
    _nodes.clear();
    _records.clear();
    _fields.clear();
    _archive = archive;
    return archive.size() <= UINT32_MAX && Parser(*this).parse();
}

Value::Type ArchivedValue::type() const
{
    return _archive ? _archive->_nodes[_node].token.type : Value::Type::Null;
}

Value ArchivedValue::value() const
{
    if (!_archive) return {};
    const auto& [token, next] = _archive->_nodes[_node];
    switch (token.type) {
    case Value::Type::Array: {
        Value::Array array;
        array.reserve(token.size);
        forEach([&](ArchivedValue element) { array.push_back(element.value()); });
        return array;
    }
    case Value::Type::Dictionary: {
        Dictionary dictionary;
        dictionary.reserve(token.size);
        forEachEntry(
            [&](std::string_view key, ArchivedValue entry) { dictionary.set(std::string(key), entry.value()); });
        return dictionary;
    }
    default: return archives::plainValue(token);
    }
}

bool ArchivedValue::hasDuplicateKeys() const
{
    // Small dictionaries are compared pairwise; a larger one counts as if it had duplicates.
    constexpr std::size_t kSmall = 24;
    std::array<std::string_view, kSmall> keys;
    std::size_t count = 0;
    bool duplicate = _archive->_nodes[_node].token.size > kSmall;
    if (!duplicate)
        forEachEntry([&](std::string_view key, ArchivedValue) {
            duplicate |= std::find(keys.begin(), keys.begin() + count, key) != keys.begin() + count;
            keys[count++] = key;
        });
    return duplicate;
}

void ArchivedValue::write(JsonSink& sink) const
{
    switch (type()) {
    case Value::Type::Null: return sink.null();
    case Value::Type::Bool: return sink.boolean(_archive->_nodes[_node].token.boolean);
    case Value::Type::Int: return sink.integer(_archive->_nodes[_node].token.integer);
    case Value::Type::UInt: return sink.unsignedInteger(_archive->_nodes[_node].token.unsignedInteger);
    case Value::Type::Double: return sink.real(_archive->_nodes[_node].token.real);
    case Value::Type::String: return sink.string(_archive->_nodes[_node].token.text());
    case Value::Type::Bytes:
    case Value::Type::Date: return sink.value(value());
    case Value::Type::Array:
        sink.beginArray();
        forEach([&](ArchivedValue element) { element.write(sink); });
        return sink.endArray();
    case Value::Type::Dictionary:
        if (hasDuplicateKeys()) return sink.value(value());
        sink.beginObject();
        forEachEntry([&](std::string_view key, ArchivedValue entry) {
            sink.key(key);
            entry.write(sink);
        });
        return sink.endObject();
    }
}

} // namespace platform
