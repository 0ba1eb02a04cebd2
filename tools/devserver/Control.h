#pragma once

#include "tools/devserver/Http.h"

namespace devserver {

class Service;

/// Answers a call under /control: faults, the bag, the log of requests and uploads. Only clients on this machine may
/// call, and only over plain HTTP. Errors are {"error": text}, and the text says what is allowed.
[[nodiscard]] Answer controlAnswer(Service& service, const Request& request);

} // namespace devserver
