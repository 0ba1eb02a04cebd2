#pragma once

#include "platform/values/Value.h"

namespace devserver {

/// Returns {"sent", "from_memory", "latencies"} of an uploaded session: the number of requests that the device sent for
/// searches, the number of searches that it answered from its cache, and the milliseconds from the start of a request
/// to the end of its answer, as the device measured them, the first 200. Returns zeros for any other value.
[[nodiscard]] platform::Value searchFigures(const platform::Value& session);

} // namespace devserver
