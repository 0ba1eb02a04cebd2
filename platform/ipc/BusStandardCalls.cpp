#include "platform/ipc/BusStandardCalls.h"

#include <fmt/format.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>

#include "platform/ipc/BusValue.h"

namespace platform::ipc {

namespace {

constexpr unsigned kAlreadyRunning = 2; // DBUS_START_REPLY_ALREADY_RUNNING

constexpr std::string_view kDoctype =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    " \"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n";

/// Returns a reply with these values; null if sd-bus is out of memory.
template <class... Values> BusMessage makeAnswer(sd_bus_message* call, const char* signature = "", Values... values)
{
    sd_bus_message* answer = nullptr;
    if (sd_bus_message_new_method_return(call, &answer) < 0) return {};
    BusMessage owned(answer);
    if (*signature && sd_bus_message_append(answer, signature, values...) < 0) return {};
    return owned;
}

/// Returns the name of the child of `path` that leads to the object at `below`; empty if `below` is not below `path`.
std::string_view childTowardsObject(std::string_view path, std::string_view below)
{
    if (path != "/") {
        if (!below.starts_with(path)) return {};
        below.remove_prefix(path.size());
    }
    if (!below.starts_with('/')) return {};
    below.remove_prefix(1);
    return below.substr(0, below.find('/'));
}

BusMessage introspect(sd_bus_message* call, std::string_view path, const Interface& interface)
{
    if (path == interface.path) return makeAnswer(call, "s", std::string(interface.introspection).c_str());
    const auto child = childTowardsObject(path, interface.path);
    if (child.empty()) return {};
    return makeAnswer(call, "s", fmt::format("{}<node>\n <node name=\"{}\"/>\n</node>\n", kDoctype, child).c_str());
}

/// Replies that the object has no properties.
BusMessage properties(sd_bus_message* call, std::string_view member)
{
    const char* interface = nullptr;
    const char* property = nullptr;
    if (member == "GetAll" && sd_bus_message_has_signature(call, "s")) return makeAnswer(call, "a{sv}", 0);
    if ((member == "Get" || member == "Set") && sd_bus_message_read(call, "ss", &interface, &property) > 0)
        return makeErrorAnswer(
            call, {SD_BUS_ERROR_UNKNOWN_PROPERTY, fmt::format("{} has no property \"{}\"", interface, property)});
    return {};
}

/// Replies to the calls that clients send to a message bus.
BusMessage messageBus(sd_bus_message* call, std::string_view member)
{
    if (member == "Hello") return makeAnswer(call, "s", kPeerName);
    if (member == "AddMatch" || member == "RemoveMatch") return makeAnswer(call);
    if (member == "GetNameOwner" && sd_bus_message_has_signature(call, "s")) return makeAnswer(call, "s", kOwnName);
    if (member == "NameHasOwner" && sd_bus_message_has_signature(call, "s")) return makeAnswer(call, "b", 1);
    if (member == "StartServiceByName" && sd_bus_message_has_signature(call, "su"))
        return makeAnswer(call, "u", kAlreadyRunning);
    if (member == "ListNames") return makeAnswer(call, "as", 2, kOwnName, kPeerName);
    return {};
}

BusMessage peer(sd_bus_message* call, std::string_view member)
{
    if (member == "Ping") return makeAnswer(call);
    sd_id128_t machine;
    char text[SD_ID128_STRING_MAX];
    if (member == "GetMachineId" && sd_id128_get_machine(&machine) >= 0)
        return makeAnswer(call, "s", sd_id128_to_string(machine, text));
    return {};
}

} // namespace

BusMessage answerStandardCall(sd_bus_message* call, const Interface& interface)
{
    const char* interfaceName = sd_bus_message_get_interface(call);
    const char* memberName = sd_bus_message_get_member(call);
    const char* path = sd_bus_message_get_path(call);
    if (!interfaceName || !memberName || !path) return {};

    const std::string_view called = interfaceName;
    const std::string_view member = memberName;
    if (called == "org.freedesktop.DBus.Introspectable" && member == "Introspect")
        return introspect(call, path, interface);
    if (called == "org.freedesktop.DBus.Properties" && path == interface.path) return properties(call, member);
    if (called == "org.freedesktop.DBus.Peer") return peer(call, member);
    if (called == "org.freedesktop.DBus") return messageBus(call, member);
    return {};
}

BusMessage makeErrorAnswer(sd_bus_message* call, const CallError& error)
{
    const std::string text = busText(error.message);
    const sd_bus_error busError = {error.name.c_str(), text.c_str(), 0};
    const sd_bus_error unnamed = {SD_BUS_ERROR_FAILED, text.c_str(), 0};
    sd_bus_message* answer = nullptr;
    if (sd_bus_message_new_method_error(call, &answer, &busError) < 0 &&
        sd_bus_message_new_method_error(call, &answer, &unnamed) < 0)
        return {};
    return BusMessage(answer);
}

} // namespace platform::ipc
