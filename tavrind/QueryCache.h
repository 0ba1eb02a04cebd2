#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/device/MemoryPressure.h"
#include "platform/run/NotificationCenter.h"
#include "tavrind/CachedResultSet.h"
#include "tavrind/CritbitTree.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct TAVRequest;

/// Result sets in memory that answer a user who types on: a set for the query "weather today" that was fetched when
/// "wea" had been typed answers "wea", "weat" and so on, up to the whole query.
///
/// Cost: a set costs one and a half times the length of its JSON. All sets stored since the cache was last empty cost
/// less than 2 MiB (2,097,152 bytes) together, those replaced or expired since included. A set that would exceed that
/// clears the cache first; a set that costs 2 MiB alone is not stored.
///
/// The cache clears itself when the user's GUID, country, time zone, locale or the device's settings change, and when
/// memory runs short, which it watches only while it holds something.
///
/// Look-ups block until the cache's queue has run what was posted before; storing and clearing are posted. Any thread
/// but the run loop's.
class QueryCache : public std::enable_shared_from_this<QueryCache> {
public:
    /// An empty cache that observes the notifications of its assembly.
    [[nodiscard]] static std::shared_ptr<QueryCache> make(Assembly& assembly);
    explicit QueryCache(Assembly& assembly);

    /// The set that answers the request's text at its scale; null if there is none. Removes the expired sets it meets.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> getRequest(const TAVRequest& request);
    /// The same for a text at any scale.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> get(std::string text);
    /// Stores the set under its query and replaces the set there. A set whose query is empty or contains a NUL is
    /// ignored; so is, with an error in the log, one whose input is longer than its query.
    void set(std::shared_ptr<const CachedResultSet> set);
    /// Stores the sets that `make` returns, unless `removeAllObjects` or a notification has emptied the cache since
    /// `generation` was read: they were fetched for what the user, the device or the client was before. `make` is
    /// called on the cache's queue, ahead of every look-up that begins after this call.
    void setMade(std::move_only_function<std::vector<std::shared_ptr<const CachedResultSet>>()> make,
                 std::uint64_t generation);
    /// Changes whenever the answers of requests that were built before must no longer be stored.
    [[nodiscard]] std::uint64_t generation() const { return _generation; }
    void removeAllObjects();
    [[nodiscard]] std::size_t count() const;

private:
    void _cacheClearNotification();
    [[nodiscard]] static bool _isKept(const CachedResultSet& set);
    void _store(std::shared_ptr<const CachedResultSet> set);
    void _clearCache();
    void _startListeningForMemoryPressure();

    Assembly& _assembly;
    std::atomic<std::uint64_t> _generation = 0;
    std::vector<platform::NotificationCenter::Token> _observers;
    std::shared_ptr<platform::Queue> _queue; // guards all below
    CritbitTree<const CachedResultSet> _tree;
    std::vector<std::shared_ptr<const CachedResultSet>> _stored; // owns what the tree refers to; replaced sets, too
    std::size_t _currentCost = 0;
    std::unique_ptr<platform::MemoryPressure::Watch> _source;
};

} // namespace tavrin
