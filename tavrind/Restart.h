#pragma once

#include <functional>

namespace tavrin {

/// Replaces this process by a new one of the same program, arguments and process id that removes the users' traces
/// before it serves anyone: nothing that is in memory now can be written after the removal. Sockets that the service
/// manager passed stay open; all other descriptors are closed. Returns only if that fails, which is logged. Any thread.
void startAgainWiped(int argc, char** argv, bool settings);

/// What the program adds to the device.
struct StartOptions {
    std::function<void(bool settings)> startAgainWiped; ///< `startAgainWiped`; empty: clients can't wipe
    bool wiped = false;                                 ///< this process has removed all traces before its start
};

} // namespace tavrin
