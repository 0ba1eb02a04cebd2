#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/ipc/Ipc.h"

struct sd_bus_message;

/// Reads and writes the values of bus messages. Use these only where the message's bus may be used.
namespace platform::ipc {

/// The most file handles that one message may carry.
inline constexpr std::size_t kMaximumHandles = 16;

/// Reads one message from start to end, and estimates the memory that the values take. After the first failure all
/// reads return null or an empty text.
class BusReader {
public:
    /// Fails with LimitsExceeded if the values take more than `maximumSize` bytes. `bus` must outlive the reader.
    BusReader(sd_bus_message* bus, std::size_t maximumSize) : _bus(bus), _maximumSize(maximumSize) {}

    /// Returns whether the whole message was read.
    [[nodiscard]] bool atEnd() const;
    /// Reads the next value of any type.
    Value value() { return value(false); }
    /// Reads a value inside a variant, which can't hold a file handle.
    Value valueInVariant() { return value(true); }

    // For callers that read a part of the message themselves. Texts are valid as long as the message.
    [[nodiscard]] sd_bus_message* bus() const { return _bus; }
    template <class T> T basic(char type)
    {
        T read{};
        readBasic(type, &read);
        return read;
    }
    std::string_view text(char type, std::size_t cost);
    std::string_view byteString();
    /// Adds to the estimate. Fails and returns false beyond the limit.
    bool charge(std::size_t bytes);

    /// Why reading failed.
    std::optional<CallError>& error() { return _error; }
    /// Returns the estimated memory of all values that were read, in bytes.
    [[nodiscard]] std::size_t size() const { return _size; }
    [[nodiscard]] std::vector<FileHandle> takeHandles() { return std::move(_handles); }

    // Estimated memory of decoded values in bytes, with the overhead of containers and the allocator.
    static constexpr std::size_t kScalarCost = 2 * sizeof(Value);
    static constexpr std::size_t kTextCost = 128;
    static constexpr std::size_t kContainerCost = 192;
    static constexpr std::size_t kKeyCost = 96;

private:
    Value fail(std::string message, std::string name = CallError().name);
    void readBasic(char type, void* to);
    Value value(bool inVariant);
    Value handle();
    Value variant(const char* contents);
    Value array(const std::string& contents, bool inVariant);
    Value dictionary(const std::string& contents, bool inVariant);

    sd_bus_message* const _bus;
    const std::size_t _maximumSize;
    std::size_t _size = 0;
    std::vector<FileHandle> _handles;
    std::optional<CallError> _error;
};

/// Appends values to a message and estimates its size. After a call has returned false, `reason` says why and the
/// message is unusable.
class BusWriter {
public:
    /// Both must outlive the writer.
    BusWriter(sd_bus_message* bus, const std::vector<FileHandle>& handles) : _bus(bus), _handles(handles) {}

    /// Appends a value of one complete type: see `Message`. Null is sent as the zero of its type.
    bool append(std::string_view type, const Value& value);
    /// Appends a variant whose type is selected by the value's.
    bool appendVariant(const Value& value);
    bool appendTextVariant(std::string_view text);

    // The parts of a value
    bool appendText(std::string_view text);
    bool open(char type, const char* contents);
    bool close();

    /// Prepends the field in which a value could not be appended.
    void failedIn(std::string_view field);
    [[nodiscard]] std::size_t size() const { return _size; }
    std::string reason;

private:
    bool mismatch(std::string_view type);
    bool check(int result);
    void count(std::size_t bytes);
    template <class T> bool appendBasic(char type, T value);
    template <class T, class From> bool appendNumber(std::string_view type, std::optional<From> value);
    bool appendBytes(const Bytes& bytes);
    bool appendArray(std::string_view element, const Value::Array& array);
    bool appendDictionary(const Dictionary& dictionary);

    sd_bus_message* const _bus;
    const std::vector<FileHandle>& _handles;
    std::size_t _size = 0;
};

/// Replaces invalid UTF-8, U+0000 and noncharacters, which sd-bus rejects, by U+FFFD.
[[nodiscard]] std::string busText(std::string_view text);

} // namespace platform::ipc
