#pragma once

#include "tools/devserver/Http.h"

namespace devserver {

class Service;

/// Answers what is under /control: faults, the bag, what was asked and uploaded. Only for clients of this machine, and
/// not over TLS. Errors are {"error": "… what is allowed …"}.
[[nodiscard]] Answer controlAnswer(Service& service, const Request& request);

} // namespace devserver
