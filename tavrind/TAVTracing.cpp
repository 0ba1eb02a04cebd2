#include "tavrind/TAVTracing.h"

#include <mutex>

#include "platform/base/Log.h"
#include "platform/base/Trace.h"
#include "platform/files/UserDefaults.h"

namespace tavrin {

std::atomic<bool> TAVTraceEnabled = false;

void TAVTracingSetup(const platform::UserDefaults& userDefaults)
{
    static std::once_flag once;
    std::call_once(once, [&] {
        TAVTraceEnabled = userDefaults.boolean("TraceEnabled");
        platform::defaultLog().log("TAVTraceEnabled flag set to {:d}", TAVTraceEnabled.load());
    });
}

void TAVTrace(TAVTraceCode code, std::uint64_t queryId)
{
    if (code != kTraceNone && TAVTraceEnabled.load(std::memory_order_relaxed)) platform::tracePoint(code, queryId);
}

} // namespace tavrin
