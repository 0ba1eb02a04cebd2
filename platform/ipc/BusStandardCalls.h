#pragma once

#include "platform/ipc/BusMessage.h"

/// The calls that every D-Bus object answers, so that busctl, gdbus and bindings of other languages can connect here as
/// they do to a message bus: Introspect, Properties, and of the bus itself what clients say to it before anything else.
/// (Peer, with Ping, is answered by sd-bus.)
namespace platform::ipc {

/// The answer to such a call, ready to be sent; null for a call that is none of these.
[[nodiscard]] BusMessage answerStandardCall(sd_bus_message* call, const Interface& interface);

/// An error as the answer to `call`. Null if there is no memory.
[[nodiscard]] BusMessage makeErrorAnswer(sd_bus_message* call, const CallError& error);

} // namespace platform::ipc
