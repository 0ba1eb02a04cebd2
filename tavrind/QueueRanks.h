#pragma once

#include "platform/run/QueueOrder.h"

/// The order of the daemon's queues. `platform::QueueOrder` checks it in all tests, and in a daemon that was started
/// with --check-queues.
namespace tavrin::rank {

/// Connections, delegate and global queues, scheduled activities, images, downloads: work begins here.
inline constexpr platform::Rank kRoot = platform::Rank::Root;
/// The service, the cache of client states, session managers, Lookup.
inline constexpr platform::Rank kManager{1};
/// Sessions that several agents share, the buffer of a flush.
inline constexpr platform::Rank kShared{2};
/// Sessions and their files, first use, flusher bridge, client states and their caches, bag, allow-list, subscriptions.
inline constexpr platform::Rank kStore{3};
/// Request context, transfers, feedback counts, the HTTP cache.
inline constexpr platform::Rank kContext{4};
/// The GUID.
inline constexpr platform::Rank kGuid{5};

} // namespace tavrin::rank
