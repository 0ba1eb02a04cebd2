#include "platform/ipc/SystemBus.h"

#include <optional>
#include <utility>

#include <systemd/sd-bus.h>

#include "platform/ipc/BusMessage.h"
#include "platform/ipc/BusValue.h"
#include "platform/run/RunLoop.h"

namespace platform::ipc {

namespace {

constexpr const char* kProperties = "org.freedesktop.DBus.Properties";
/// Far more than any reply of the services in use.
constexpr std::size_t kMaximumSystemAnswer = 1u << 20;

/// Returns the error of a reply, or nothing. `message` is null if the call could not be sent.
std::optional<CallError> errorOf(sd_bus_message* message)
{
    if (!message) return CallError{.name = SD_BUS_ERROR_DISCONNECTED, .message = "no message bus"};
    const sd_bus_error* error = sd_bus_message_get_error(message);
    if (!error) return std::nullopt;
    return CallError{.name = error->name, .message = error->message ? error->message : error->name};
}

CallResult argumentsOf(sd_bus_message* message)
{
    if (auto error = errorOf(message)) return std::unexpected(std::move(*error));
    auto decoded = decodeArguments(message, kMaximumSystemAnswer);
    if (!decoded) return std::unexpected(std::move(decoded.error()));
    return std::move(decoded->message);
}

/// Reads a variant of type b, u or d, which the properties in use have; skips others and returns null.
Value readVariant(sd_bus_message* message)
{
    const char* type = nullptr;
    if (sd_bus_message_peek_type(message, nullptr, &type) <= 0) return {};
    const std::string_view contents = type;
    int truth = 0;
    std::uint32_t number = 0;
    double real = 0;
    if (contents == "b") return sd_bus_message_read(message, "v", "b", &truth) > 0 ? Value(truth != 0) : Value();
    if (contents == "u") return sd_bus_message_read(message, "v", "u", &number) > 0 ? Value(number) : Value();
    if (contents == "d") return sd_bus_message_read(message, "v", "d", &real) > 0 ? Value(real) : Value();
    sd_bus_message_skip(message, "v");
    return {};
}

std::expected<Dictionary, CallError> propertiesOf(sd_bus_message* message)
{
    if (auto error = errorOf(message)) return std::unexpected(std::move(*error));
    Dictionary properties;
    int result = sd_bus_message_enter_container(message, SD_BUS_TYPE_ARRAY, "{sv}");
    while (result >= 0 && (result = sd_bus_message_enter_container(message, SD_BUS_TYPE_DICT_ENTRY, "sv")) > 0) {
        const char* name = nullptr;
        if ((result = sd_bus_message_read(message, "s", &name)) < 0) break;
        if (Value value = readVariant(message); !value.isNull()) properties.set(name, std::move(value));
        result = sd_bus_message_exit_container(message);
    }
    if (result < 0) return std::unexpected(CallError{.message = "the properties can't be read"});
    return properties;
}

using Receiver = std::move_only_function<void(sd_bus_message*)>;

int receive(sd_bus_message* message, void* receiver, sd_bus_error*)
{
    (*static_cast<Receiver*>(receiver))(message);
    return 0;
}

/// Makes the slot the owner of its receiver.
void own(sd_bus_slot* slot, std::unique_ptr<Receiver> receiver)
{
    sd_bus_slot_set_destroy_callback(slot, [](void* data) { delete static_cast<Receiver*>(data); });
    (void)receiver.release();
}

} // namespace

void SystemBus::EndWatch::operator()(sd_bus_slot* slot) const
{
    sd_bus_slot_unref(slot);
}

SystemBus::SystemBus(RunLoop& runLoop, Bus bus, std::function<void()> lost)
    : _runLoop(runLoop), _which(bus), _lost(std::move(lost))
{}

SystemBus::~SystemBus()
{
    sd_bus_close_unref(_bus);
}

bool SystemBus::connect()
{
    if (_bus && sd_bus_is_open(_bus) > 0) return true;
    _bus = sd_bus_close_unref(_bus);
    if ((_which == Bus::System ? sd_bus_open_system(&_bus) : sd_bus_open_user(&_bus)) < 0) return false;
    sd_bus_attach_event(_bus, _runLoop.handle(), SD_EVENT_PRIORITY_NORMAL);
    constexpr const char* kLocal = "org.freedesktop.DBus.Local";
    if (_lost)
        _disconnected =
            onSignal({kLocal, "/org/freedesktop/DBus/Local", kLocal}, "Disconnected", [this](auto) { _lost(); });
    return true;
}

void SystemBus::call(const Object& object, const char* method, Answer answer)
{
    Receiver receiver;
    if (answer) receiver = [answer = std::move(answer)](sd_bus_message* reply) mutable { answer(argumentsOf(reply)); };
    send(newCall(object, object.interface, method), std::move(receiver));
}

void SystemBus::getProperties(const Object& object, Properties answer)
{
    BusMessage call = newCall(object, kProperties, "GetAll");
    if (call) {
        sd_bus_message_set_auto_start(call.get(), false);
        sd_bus_message_append(call.get(), "s", object.interface.c_str());
    }
    send(std::move(call), [answer = std::move(answer)](sd_bus_message* reply) mutable { answer(propertiesOf(reply)); });
}

void SystemBus::setProperty(const Object& object, const char* name, const char* type, const Value& value)
{
    BusMessage call = newCall(object, kProperties, "Set");
    if (!call) return;
    sd_bus_message_append(call.get(), "ss", object.interface.c_str(), name);
    sd_bus_message_open_container(call.get(), SD_BUS_TYPE_VARIANT, type);
    if (!encodeArguments(call.get(), type, {.args = {value}})) return;
    sd_bus_message_close_container(call.get());
    send(std::move(call), {});
}

bool SystemBus::emit(const std::string& path, const std::string& interface, const char* signal, const std::string& text)
{
    return connect() &&
           sd_bus_emit_signal(_bus, path.c_str(), interface.c_str(), signal, "s", busText(text).c_str()) >= 0;
}

SystemBus::Watch SystemBus::onSignal(const Object& object, const char* signal, Answer handler)
{
    if (!connect()) return {};
    auto receiver = std::make_unique<Receiver>(
        [handler = std::move(handler)](sd_bus_message* message) mutable { handler(argumentsOf(message)); });
    sd_bus_slot* slot = nullptr;
    if (sd_bus_match_signal_async(_bus, &slot, object.service.c_str(), object.path.c_str(), object.interface.c_str(),
                                  signal, receive, nullptr, receiver.get()) < 0)
        return {};
    own(slot, std::move(receiver));
    return Watch(slot);
}

SystemBus::Watch SystemBus::onOwnerChange(const std::string& service, std::function<void()> handler)
{
    if (!connect()) return {};
    const std::string match =
        "type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',arg0='" + service + "'";
    auto receiver = std::make_unique<Receiver>([handler = std::move(handler)](sd_bus_message*) { handler(); });
    sd_bus_slot* slot = nullptr;
    if (sd_bus_add_match_async(_bus, &slot, match.c_str(), receive, nullptr, receiver.get()) < 0) return {};
    own(slot, std::move(receiver));
    return Watch(slot);
}

BusMessage SystemBus::newCall(const Object& object, const std::string& interface, const char* method)
{
    sd_bus_message* call = nullptr;
    if (connect())
        sd_bus_message_new_method_call(_bus, &call, object.service.c_str(), object.path.c_str(), interface.c_str(),
                                       method);
    return BusMessage(call);
}

void SystemBus::send(BusMessage call, Receiver receive_)
{
    if (!receive_) {
        if (call) sd_bus_send(_bus, call.get(), nullptr);
        return;
    }
    auto receiver = std::make_unique<Receiver>(std::move(receive_));
    sd_bus_slot* slot = nullptr;
    if (!call || sd_bus_call_async(_bus, &slot, call.get(), receive, receiver.get(), 0) < 0)
        return (*receiver)(nullptr);
    own(slot, std::move(receiver));
    sd_bus_slot_set_floating(slot, true);
    sd_bus_slot_unref(slot); // a floating slot: the bus owns it until the reply
}

} // namespace platform::ipc
