#include "platform/base/Trace.h"

#include <sys/sdt.h>

namespace platform {

void tracePoint(std::uint32_t code, std::uint64_t id)
{
    DTRACE_PROBE2(TRACE_PROVIDER, point, code, id);
}

} // namespace platform
