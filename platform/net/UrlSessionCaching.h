#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// Returns a session whose data tasks read `cache` first and fill it, by the rules of HTTP. `loads`, which must have
/// the same delegate queue, performs the other loads, revalidations and transfer tasks.
///
/// A response is in the cache before the task's completion runs. Bodies from the cache are copies in memory, which
/// changes of the cache's files don't affect. The timing data of a cached response has only its start and end. Any
/// thread.
[[nodiscard]] std::shared_ptr<UrlSession> makeCachingSession(std::shared_ptr<UrlSession> loads,
                                                             std::shared_ptr<HttpCache> cache,
                                                             std::shared_ptr<Queue> delegateQueue);

} // namespace platform
