#pragma once

#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/ipc/Ipc.h"

struct sd_bus;
struct sd_bus_message;

/// Encodes and decodes the arguments of bus messages. Call these only on the thread that uses the message's bus.
namespace platform::ipc {

struct BusMessageUnref {
    void operator()(sd_bus_message* message) const;
};
/// A counted reference to a bus message.
using BusMessage = std::unique_ptr<sd_bus_message, BusMessageUnref>;
/// Closes and releases the bus.
struct BusUnref {
    void operator()(sd_bus* bus) const;
};

struct DecodedArguments {
    Message message;
    std::size_t size = 0; ///< estimated bytes of memory
};

/// Reads all arguments of a received message by the message's signature. Variants may contain numbers, texts, byte
/// strings, arrays, and dictionaries with string keys. File handles are duplicated; a variant can't contain one. The
/// error names the argument; it is LimitsExceeded if the values take more than `maximumSize` bytes.
///
/// The arguments of `records` are read straight into records. If one can't be read, all are left as dictionaries.
[[nodiscard]] std::expected<DecodedArguments, CallError>
decodeArguments(sd_bus_message* message, std::size_t maximumSize, const RecordArguments& records = {});

/// Appends `message` to a new bus message by `signature` and returns its estimated size in bytes. A null argument is
/// sent as the zero of its type; see `Message` for null inside containers. Texts pass through `busText`. If a value
/// doesn't fit its type, returns an error that names the argument; the bus message is then unusable. A record is sent
/// like its `toValue`.
[[nodiscard]] std::expected<std::size_t, std::string> encodeArguments(sd_bus_message* bus, std::string_view signature,
                                                                      const Message& message);

} // namespace platform::ipc
