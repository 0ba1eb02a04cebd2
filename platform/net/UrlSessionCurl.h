#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

class Clock;
class WorkerPool;

/// Returns a loader with one libcurl multi handle, which all its sessions share. Its sockets are watched by `pool`,
/// which must outlive the loader, like `clock`. Destroying the loader cancels all tasks and blocks until that is done;
/// its sessions must not be used afterwards.
[[nodiscard]] std::unique_ptr<UrlLoader> makeCurlLoader(WorkerPool& pool, Clock& clock);

} // namespace platform
