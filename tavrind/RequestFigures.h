#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>

#include "CoreTavrin/LatencyHistogram.h"
#include "platform/base/Mutex.h"
#include "platform/values/Value.h"

namespace tavrin {

/// Counts requests and their latencies since the start of the process, by kind, for live displays. In memory only. Any
/// thread.
class RequestFigures {
public:
    /// Counts one request. `kind` is a constant of the daemon, such as "query" or "image".
    void record(std::string_view kind, platform::Duration latency, bool failed);
    /// Returns {kind: {"count", "failed", "latency": [count of each bucket]}}.
    [[nodiscard]] platform::Value description() const;

private:
    struct Figure {
        std::uint64_t count = 0;
        std::uint64_t failed = 0;
        LatencyCounts latency{};
    };
    mutable platform::Mutex _mutex;
    std::map<std::string, Figure, std::less<>> _figures GUARDED_BY(_mutex);
};

} // namespace tavrin
