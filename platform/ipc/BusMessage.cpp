#include "platform/ipc/BusMessage.h"

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include "platform/ipc/BusRecord.h"
#include "platform/ipc/BusValue.h"
#include "platform/values/Record.h"

namespace platform::ipc {

namespace {

std::expected<DecodedArguments, CallError> readArguments(sd_bus_message* message, std::size_t maximumSize,
                                                         const RecordArguments& records)
{
    DecodedArguments decoded;
    auto& [args, handles, recordsRead] = decoded.message;
    BusReader reader(message, maximumSize);
    while (!reader.atEnd() && !reader.error()) {
        const std::size_t index = args.size();
        if (records.has(index)) {
            recordsRead.resize(index + 1);
            recordsRead[index] = readRecord(reader, records.classes());
            args.emplace_back();
            if (!recordsRead[index]) return std::unexpected(CallError());
        } else {
            args.push_back(reader.value());
        }
        if (reader.error())
            reader.error()->message = fmt::format("argument {}: {}", index + 1, reader.error()->message);
    }
    if (reader.error()) return std::unexpected(std::move(*reader.error()));
    handles = reader.takeHandles();
    decoded.size = reader.size();
    return decoded;
}

/// Returns the length of the first complete type of a signature: a basic type, "v", "a{sv}", or an array of these.
std::size_t firstType(std::string_view signature)
{
    constexpr std::string_view kDictionary = "a{sv}";
    if (signature.starts_with(kDictionary)) return kDictionary.size();
    return signature.starts_with('a') && signature.size() > 1 ? 1 + firstType(signature.substr(1)) : 1;
}

} // namespace

void BusMessageUnref::operator()(sd_bus_message* message) const
{
    sd_bus_message_unref(message);
}

void BusUnref::operator()(sd_bus* bus) const
{
    sd_bus_close_unref(bus);
}

std::expected<DecodedArguments, CallError> decodeArguments(sd_bus_message* message, std::size_t maximumSize,
                                                           const RecordArguments& records)
{
    if (records.which != 0) {
        auto decoded = readArguments(message, maximumSize, records);
        if (decoded) return decoded;
        // What is not read as a record is read as a value, which also finds the reason.
        sd_bus_message_rewind(message, true);
    }
    return readArguments(message, maximumSize, {});
}

std::expected<std::size_t, std::string> encodeArguments(sd_bus_message* bus, std::string_view signature,
                                                        const Message& message)
{
    BusWriter writer(bus, message.handles);
    std::size_t index = 0;
    for (; !signature.empty(); ++index) {
        const auto type = signature.substr(0, firstType(signature));
        signature.remove_prefix(type.size());
        if (index >= message.args.size()) return std::unexpected(fmt::format("argument {} is missing", index + 1));
        const Record* record = message.record(index);
        if (!(record ? type == "a{sv}" && appendRecord(writer, *record) : writer.append(type, message.args[index])))
            return std::unexpected(fmt::format("argument {}: {}", index + 1, writer.reason));
    }
    if (index < message.args.size()) return std::unexpected(fmt::format("argument {} is not expected", index + 1));
    return writer.size();
}

} // namespace platform::ipc
