#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// Makes the loader: one libcurl multi handle, shared by all its sessions, on a thread of its own that starts with the
/// first task. Destroying the loader cancels all tasks and joins the thread; its sessions must not be used afterwards.
[[nodiscard]] std::unique_ptr<UrlLoader> makeCurlLoader();

} // namespace platform
