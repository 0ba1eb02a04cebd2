#include "platform/Trace.h"

#include <sys/sdt.h>

namespace platform {

void tracePoint(std::uint32_t code, std::uint64_t id)
{
    DTRACE_PROBE2(tavrind, point, code, id);
}

} // namespace platform
