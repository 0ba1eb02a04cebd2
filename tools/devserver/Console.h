#pragma once

#include "tools/devserver/Http.h"

namespace devserver {

/// Returns a file of the console page, which lives at /console and is compiled in; refuses what `refusedAsStrange`
/// refuses. The page uses the calls of /control. Its library for charts, /console/chart.js, is read from Debian's
/// package libjs-chart.js; without that package, it is an empty script.
[[nodiscard]] Answer consoleAnswer(const Request& request);

} // namespace devserver
