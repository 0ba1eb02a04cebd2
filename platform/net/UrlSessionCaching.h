#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// Makes a session whose data tasks look into `cache` first and fill it, by the rules of HTTP. What isn't cached, or
/// must be confirmed, is loaded by `loads`, which must have the same delegate queue. Transfer tasks go to `loads`.
///
/// An answer is in the cache before the task's completion runs. Bodies from the cache are copies in memory: no change
/// of the cache's files reaches them. Timing data of an answer from the cache has only its start and end. Any thread.
[[nodiscard]] std::shared_ptr<UrlSession> makeCachingSession(std::shared_ptr<UrlSession> loads,
                                                             std::shared_ptr<HttpCache> cache,
                                                             std::shared_ptr<Queue> delegateQueue);

} // namespace platform
