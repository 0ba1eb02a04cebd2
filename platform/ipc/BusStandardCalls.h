#pragma once

#include "platform/ipc/BusMessage.h"

/// The calls that every D-Bus object supports, and those that clients send to a message bus first (Hello, AddMatch, …),
/// so that tools and bindings of other languages can connect as they do to a message bus. Every bus name counts as this
/// service's, and the service counts as running. Call these only on the thread that uses the message's bus.
namespace platform::ipc {

/// The unique names of the two ends, as on a message bus with one peer. Every message to a peer has both: some bindings
/// drop signals without a sender, others take their own name from the reply to Hello.
inline constexpr const char* kOwnName = ":1.0";
inline constexpr const char* kPeerName = ":1.1";

/// Returns the reply to a standard call, ready to send; null for any other call.
[[nodiscard]] BusMessage answerStandardCall(sd_bus_message* call, const Interface& interface);

/// Returns an error reply to `call`; null if sd-bus is out of memory. An invalid error name becomes "Failed".
[[nodiscard]] BusMessage makeErrorAnswer(sd_bus_message* call, const CallError& error);

} // namespace platform::ipc
