#pragma once

#include <cstdint>

namespace platform {

/// A trace point that perf, bpftrace or SystemTap can attach to as the static probe "PROVIDER:point" with the
/// arguments (code, id). Costs one no-operation instruction while nobody is attached. Any thread.
void tracePoint(std::uint32_t code, std::uint64_t id);

} // namespace platform
