#pragma once

#include "platform/ipc/BusMessage.h"

/// The calls that every D-Bus object answers, so that tools and the bindings of other languages can connect here as
/// they do to a message bus: Introspect, Properties, Peer, and of the bus itself what clients ask before anything else.
/// All bus names are taken for this service's, and it counts as running.
namespace platform::ipc {

/// The unique names of the two ends, as on a message bus. Every message to a peer carries both: bindings drop signals
/// without a sender, or take their own name from the answer to Hello. Each peer has a bus of its own.
inline constexpr const char* kOwnName = ":1.0";
inline constexpr const char* kPeerName = ":1.1";

/// The answer to such a call, ready to send; null for any other call.
[[nodiscard]] BusMessage answerStandardCall(sd_bus_message* call, const Interface& interface);

/// An error as the answer to `call`; null without memory.
[[nodiscard]] BusMessage makeErrorAnswer(sd_bus_message* call, const CallError& error);

} // namespace platform::ipc
