#pragma once

namespace devserver {

/// The descriptor of this process's TCP connection from a local to a remote port; -1 if there is none. The HTTP library
/// doesn't hand its own out. Valid while the request on it is handled.
[[nodiscard]] int connectionBetween(int localPort, int remotePort);

/// Shuts down every connection of this process whose own end is that port.
void shutDownConnections(int localPort);

} // namespace devserver
