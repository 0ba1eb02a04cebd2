#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/ipc/BusMessage.h"
#include "platform/ipc/Ipc.h"
#include "platform/values/Dictionary.h"

struct sd_bus;
struct sd_bus_slot;

namespace platform {

class RunLoop;

namespace ipc {

/// A client of the system's or the user's message bus. Every call is asynchronous.
///
/// Life: the first request connects, and the first request after a disconnect connects again. After the destructor has
/// returned, no handler runs; a handler may destroy its own SystemBus. Confined to the run loop's thread; the run loop
/// must outlive it.
class SystemBus {
public:
    enum class Bus { System, User };

    /// One interface of one object.
    struct Object {
        std::string service; ///< "org.example.Service", or a unique name
        std::string path;
        std::string interface;
    };

    /// `lost` runs after an established connection has ended; its watches report nothing any more.
    SystemBus(RunLoop& runLoop, Bus bus, std::function<void()> lost = {});
    ~SystemBus();
    SystemBus(const SystemBus&) = delete;
    SystemBus& operator=(const SystemBus&) = delete;

    /// Connects if necessary. Returns false if the bus can't be reached.
    bool connect();

    using Answer = std::move_only_function<void(CallResult)>;
    using Properties = std::move_only_function<void(std::expected<Dictionary, CallError>)>;

    /// Calls a method without arguments; the bus starts the service if necessary. `answer` runs once; inside this call
    /// if nothing can be sent.
    void call(const Object& object, const char* method, Answer answer = {});
    /// Reads all properties of the interface; doesn't start the service. `answer` runs as for `call`, with the
    /// properties of types b, u and d; others are left out.
    void getProperties(const Object& object, Properties answer);
    /// Sets a property of the D-Bus type `type` ("s", "u"). Ignores the reply.
    void setProperty(const Object& object, const char* name, const char* type, const Value& value);
    /// Emits a signal with one text from the object at `path`. Returns false if it can't be sent.
    bool emit(const std::string& path, const std::string& interface, const char* signal, const std::string& text);

    struct EndWatch {
        void operator()(sd_bus_slot* slot) const;
    };
    /// Ends its watch when destroyed. May outlive the bus.
    using Watch = std::unique_ptr<sd_bus_slot, EndWatch>;

    /// Calls `handler` with the arguments of every such signal. Returns null if the bus can't be reached.
    [[nodiscard]] Watch onSignal(const Object& object, const char* signal, Answer handler);
    /// Calls `handler` when the owner of the service's name changes or exits. Returns null if the bus can't be reached.
    [[nodiscard]] Watch onOwnerChange(const std::string& service, std::function<void()> handler);

private:
    /// Receives one message, or null if the call could not be sent.
    using Receiver = std::move_only_function<void(sd_bus_message*)>;

    [[nodiscard]] BusMessage newCall(const Object& object, const std::string& interface, const char* method);
    void send(BusMessage call, Receiver receiver);

    RunLoop& _runLoop;
    const Bus _which;
    const std::function<void()> _lost;
    sd_bus* _bus = nullptr;
    Watch _disconnected;
};

} // namespace ipc
} // namespace platform
