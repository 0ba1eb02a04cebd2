#pragma once

#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

struct sd_bus_message;

/// Encodes and decodes the arguments of bus messages. Call these only on the thread that uses the message's bus.
namespace platform::ipc {

struct BusMessageUnref {
    void operator()(sd_bus_message* message) const;
};
/// A counted reference to a bus message.
using BusMessage = std::unique_ptr<sd_bus_message, BusMessageUnref>;

struct DecodedArguments {
    Message message;
    std::size_t size = 0; ///< estimated bytes of memory
};

/// The most file handles that one message may carry.
inline constexpr std::size_t kMaximumHandles = 16;

/// Reads all arguments of a received message by the message's signature. Variants may contain numbers, texts, byte
/// strings, arrays, and dictionaries with string keys. File handles are duplicated; a variant can't contain one. The
/// error names the argument; it is LimitsExceeded if the values take more than `maximumSize` bytes.
[[nodiscard]] std::expected<DecodedArguments, CallError> decodeArguments(sd_bus_message* message,
                                                                         std::size_t maximumSize);

/// Appends `message` to a new bus message by `signature` and returns its estimated size in bytes. A null argument is
/// sent as the zero of its type; see `Message` for null inside containers. Texts pass through `busText`. If a value
/// doesn't fit its type, returns an error that names the argument; the bus message is then unusable.
[[nodiscard]] std::expected<std::size_t, std::string> encodeArguments(sd_bus_message* bus, std::string_view signature,
                                                                      const Message& message);

/// Replaces invalid UTF-8, U+0000 and noncharacters, which sd-bus rejects, by U+FFFD.
[[nodiscard]] std::string busText(std::string_view text);

} // namespace platform::ipc
