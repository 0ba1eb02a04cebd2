#pragma once

#include <optional>

#include "tools/devserver/Http.h"

namespace devserver {

class Service;

/// Handles a call under /control: faults, the bag, the log of requests and uploads. Accepts no request that
/// `refusedAsStrange` refuses, and none that a web page of another origin sent. Errors are {"error": text}; the text
/// says what is allowed.
[[nodiscard]] Answer controlAnswer(Service& service, const Request& request);

/// Refuses requests over HTTPS, from other machines, and to a host name other than this machine's: a web page may
/// have its own name resolved to this machine. Returns nullopt for an allowed request.
[[nodiscard]] std::optional<Answer> refusedAsStrange(const Request& request);

} // namespace devserver
