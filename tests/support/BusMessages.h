#pragma once

#include <cerrno>
#include <string>
#include <sys/socket.h>

#include <systemd/sd-bus.h>

#include "platform/ipc/BusMessage.h"
#include "platform/values/Archive.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"
#include "tests/support/Values.h"

/// Bus messages without a peer.
namespace platform::test {

/// A message to nobody; it can be filled, sealed and read.
inline ipc::BusMessage newBusMessage()
{
    static sd_bus* const bus = [] {
        int ends[2] = {};
        sd_bus* made = nullptr;
        const bool works = socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0 &&
                           sd_bus_new(&made) >= 0 && sd_bus_set_fd(made, ends[0], ends[0]) >= 0 &&
                           sd_bus_start(made) >= 0;
        return works ? made : nullptr;
    }();
    sd_bus_message* message = nullptr;
    sd_bus_message_new_method_call(bus, &message, nullptr, "/a", "a.b", "C");
    return ipc::BusMessage(message);
}

/// A message with one a{sv}, ready to be read; null if it could not be written.
inline ipc::BusMessage sealedMessage(const ipc::Message& arguments, std::size_t* size = nullptr)
{
    ipc::BusMessage message = newBusMessage();
    const auto written = ipc::encodeArguments(message.get(), "a{sv}", arguments);
    if (!written || sd_bus_message_seal(message.get(), 1, 0) < 0) return {};
    if (size) *size = *written;
    return message;
}

inline auto decodedFromStart(const ipc::BusMessage& message, std::size_t limit, const ipc::RecordArguments& records)
{
    sd_bus_message_rewind(message.get(), true);
    return ipc::decodeArguments(message.get(), limit, records);
}

/// Reads a message's a{sv} straight into a record and by way of a dictionary. Returns how they differ; empty if they
/// don't. Sets `direct` to whether the first one gave a record.
inline std::string differenceOfRoads(const ipc::BusMessage& message, const RecordClasses& (*classes)(), bool& direct)
{
    const ipc::RecordArguments records{.which = 1, .classes = classes};
    const auto values = decodedFromStart(message, SIZE_MAX, {});
    const auto straight = decodedFromStart(message, SIZE_MAX, records);
    direct = straight && straight->message.record(0);
    if (values.has_value() != straight.has_value()) return "only one was read";
    if (!values) return values.error().message == straight.error().message ? "" : straight.error().message;
    if (values->size != straight->size) return "the sizes differ";
    const auto refused = decodedFromStart(message, values->size - 1, records);
    if (refused || refused.error().name != SD_BUS_ERROR_LIMITS_EXCEEDED) return "the limit is not kept";
    const auto record = recordFromValue(values->message.args[0], classes());
    if (!direct) return same(values->message.args, straight->message.args) ? "" : "the values differ";
    if (!record) return "a record that is none: " + record.error().reason();
    return archive(**record) == archive(*straight->message.record(0)) ? "" : "the records differ";
}

/// Writes a record straight and by way of its dictionary. Returns how they differ; empty if they don't.
inline std::string differenceOfMessages(const std::shared_ptr<const Record>& record)
{
    std::size_t sizes[2] = {};
    const ipc::BusMessage straight = sealedMessage({.args = {Value()}, .handles = {}, .records = {record}}, &sizes[0]);
    const ipc::BusMessage byValue =
        sealedMessage({.args = {toValue(*record)}, .handles = {}, .records = {}}, &sizes[1]);
    if (!straight != !byValue) return "only one was written";
    if (!straight) return "";
    if (sizes[0] != sizes[1]) return "the sizes differ";
    const auto a = decodedFromStart(straight, SIZE_MAX, {});
    const auto b = decodedFromStart(byValue, SIZE_MAX, {});
    return a && b && same(a->message.args, b->message.args) ? "" : "the messages differ";
}

} // namespace platform::test
