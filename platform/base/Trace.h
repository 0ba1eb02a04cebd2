#pragma once

#include <cstdint>

namespace platform {

/// Fires the static probe "PROVIDER:point" with the arguments (code, id), to which perf, bpftrace and SystemTap can
/// attach. PROVIDER is the compile definition `TRACE_PROVIDER`. Costs one no-operation instruction if no tracer is
/// attached. Any thread.
void tracePoint(std::uint32_t code, std::uint64_t id);

} // namespace platform
