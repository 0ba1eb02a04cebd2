#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Value.h"

namespace platform {

/// Receives a JSON value piece by piece. Each value of an object comes after its key; no key comes twice. One thread at
/// a time.
class JsonSink {
public:
    virtual ~JsonSink() = default;
    virtual void beginObject() = 0;
    virtual void key(std::string_view key) = 0;
    virtual void endObject() = 0;
    virtual void beginArray() = 0;
    virtual void endArray() = 0;
    virtual void null() = 0;
    virtual void boolean(bool value) = 0;
    virtual void integer(std::int64_t value) = 0;
    virtual void unsignedInteger(std::uint64_t value) = 0;
    virtual void real(double value) = 0;
    virtual void string(std::string_view value) = 0;
    virtual void value(const Value& value) = 0;
};

/// Writes the text that `toJson` writes for the same value.
class JsonTextSink final : public JsonSink {
public:
    /// Returns what was written since the text was last taken. The caller may take it away.
    [[nodiscard]] std::string& text() { return _text; }

    void beginObject() override;
    void key(std::string_view key) override;
    void endObject() override;
    void beginArray() override;
    void endArray() override;
    void null() override;
    void boolean(bool value) override;
    void integer(std::int64_t value) override;
    void unsignedInteger(std::uint64_t value) override;
    void real(double value) override;
    void string(std::string_view value) override;
    void value(const Value& value) override;

    // For the functions of JsonText.h
    void put(char c) { _text += c; }
    void put(std::string_view part) { _text += part; }

private:
    /// Writes the comma before a value or key that is not the first of its container.
    void separate();
    /// Writes a string, and `end` after it.
    void quote(std::string_view text, std::string_view end);

    std::string _text;
    bool _isFirst = true;
};

/// Builds the value.
class JsonValueSink final : public JsonSink {
public:
    /// Returns the value and is empty again.
    [[nodiscard]] Value take() { return std::move(_root); }

    void beginObject() override;
    void key(std::string_view key) override;
    void endObject() override { close(); }
    void beginArray() override;
    void endArray() override { close(); }
    void null() override { put({}); }
    void boolean(bool value) override { put(value); }
    void integer(std::int64_t value) override { put(value); }
    void unsignedInteger(std::uint64_t value) override { put(value); }
    void real(double value) override { put(value); }
    void string(std::string_view value) override { put(value); }
    void value(const Value& value) override { put(value); }

private:
    /// A container that is being built.
    struct Open {
        std::string key; ///< of the current entry
        Value container;
    };
    void close();
    void put(Value value);

    std::vector<Open> _open;
    Value _root;
};

} // namespace platform
