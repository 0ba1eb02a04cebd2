#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// The URL-loading thread: one libcurl multi handle that all sessions share. The thread is made with the first task.
/// Destroying the loader cancels what is under way and joins the thread; its sessions must not be used afterwards.
[[nodiscard]] std::unique_ptr<UrlLoader> makeCurlLoader();

} // namespace platform
