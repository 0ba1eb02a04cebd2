#pragma once

#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

struct sd_bus_message;

/// Encodes and decodes the arguments of bus messages. Only on the thread of the message's bus.
namespace platform::ipc {

struct BusMessageUnref {
    void operator()(sd_bus_message* message) const;
};
/// A counted reference to a bus message.
using BusMessage = std::unique_ptr<sd_bus_message, BusMessageUnref>;

struct DecodedArguments {
    Message message;
    std::size_t size = 0; ///< bytes of memory, roughly
};

/// File handles that one message may carry; more are refused.
inline constexpr std::size_t kMaximumHandles = 16;

/// Reads all arguments of a received message by its own signature. Variants may hold what a Value can: numbers, texts,
/// byte strings, arrays, dictionaries with string keys. File handles are duplicated; variants can't hold them.
/// The error names the argument; it is LimitsExceeded past `maximumSize`.
[[nodiscard]] std::expected<DecodedArguments, CallError> decodeArguments(sd_bus_message* message,
                                                                         std::size_t maximumSize);

/// Appends `message` to a new bus message by `signature` and returns its size there, roughly. A null argument
/// travels as its type's zero; null entries of dictionaries are left out, null elements
/// of arrays travel as empty dictionaries; texts are repaired by `busText`. Fails,
/// naming the argument, if a value doesn't fit its type; the bus message is useless then.
[[nodiscard]] std::expected<std::size_t, std::string> encodeArguments(sd_bus_message* bus, std::string_view signature,
                                                                      const Message& message);

/// `text`, fit for a bus message: U+FFFD stands for what is no UTF-8, for U+0000, and for noncharacters, which sd-bus
/// refuses.
[[nodiscard]] std::string busText(std::string_view text);

} // namespace platform::ipc
