#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// Returns a loader with one libcurl multi handle, which all its sessions share, on its own thread, which starts with
/// the first task. Destroying the loader cancels all tasks and joins the thread; its sessions must not be used
/// afterwards.
[[nodiscard]] std::unique_ptr<UrlLoader> makeCurlLoader();

} // namespace platform
