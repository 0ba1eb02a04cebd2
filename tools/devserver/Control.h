#pragma once

#include "tools/devserver/Http.h"

namespace devserver {

class Service;

/// Handles a call under /control: faults, the bag, the log of requests and uploads. Accepts calls only from this
/// machine and only over plain HTTP. Errors are {"error": text}; the text says what is allowed.
[[nodiscard]] Answer controlAnswer(Service& service, const Request& request);

} // namespace devserver
