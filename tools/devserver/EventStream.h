#pragma once

#include "tools/devserver/Http.h"

namespace devserver {

class Service;

/// Returns the counters of the service: {"bag_version", "requests", "by_endpoint", "uploads", "faults", "max_age",
/// "catalogue", "endpoints"}. "endpoints" has the names that faults and the log accept.
[[nodiscard]] platform::Value statusOf(const Service& service);

/// Returns a body of server-sent events that lasts until `Service::stop`, or until the peer of `connection`
/// disconnects. Each event has the log's `changesSince` the event before, the first one all of it; and, if it has
/// changed, "state":
/// {"status", "faults", "bag_changes"}. The stream occupies its connection's thread. Refuses more than 16 at a time.
[[nodiscard]] Answer eventStream(Service& service, int connection);

} // namespace devserver
