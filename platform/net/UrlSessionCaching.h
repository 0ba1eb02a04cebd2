#pragma once

#include <memory>

#include "platform/net/UrlSession.h"

namespace platform {

/// A session whose data tasks ask `cache` first and fill it, by the rules of HTTP; what it doesn't have, or must have
/// confirmed, is loaded by `loads`, whose delegate queue must be the same. Transfer tasks go to `loads` as they are.
///
/// A load's answer is in the cache before the task's completion runs. Bodies from the cache are copies in memory, which
/// no change of its files reaches. A task that asks the cache can be cancelled at
/// any time like others. Timing data of an answer from the cache has the marks of its begin and end only. Any thread.
[[nodiscard]] std::shared_ptr<UrlSession> makeCachingSession(std::shared_ptr<UrlSession> loads,
                                                             std::shared_ptr<HttpCache> cache,
                                                             std::shared_ptr<Queue> delegateQueue);

} // namespace platform
