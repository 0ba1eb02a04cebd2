#pragma once

#include <atomic>
#include <cstdint>

namespace platform {
class UserDefaults;
}

namespace tavrin {

/// Whether trace points are emitted; set once by `TAVTracingSetup`.
extern std::atomic<bool> TAVTraceEnabled;

/// Reads the user default "TraceEnabled", once per process. Any thread.
void TAVTracingSetup(const platform::UserDefaults& userDefaults);

/// Codes of the trace points of a client's calls: the start of a call, then its answer.
enum TAVTraceCode : std::uint32_t {
    kTraceNone = 0, ///< no trace point
    kTraceSearchStart = 0x2b000004,
    kTraceSearchAnswer = 0x2b000008,
    kTraceCardStart = 0x2b00000c,
    kTraceCardAnswer = 0x2b000010,
    kTraceZeroKeywordStart = 0x2b00001c,
    kTraceZeroKeywordAnswer = 0x2b000020,
    kTraceFeedbackStart = 0x2b000024,
    kTraceFeedbackAnswer = 0x2b000028,
    kTraceLookupStart = 0x2b00002c,
    kTraceLookupAnswer = 0x2b000030,
};

/// Emits a trace point if tracing is on and the code isn't `kTraceNone`. Any thread.
void TAVTrace(TAVTraceCode code, std::uint64_t queryId);

} // namespace tavrin
