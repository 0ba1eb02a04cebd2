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
#include "tavrind/CachedResultSets.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
struct TAVRequest;

/// Caches result sets in memory, for the keys that a user types next: a set for the query "weather today" that was
/// fetched for "wea" is a hit for "wea", "weat" and so on, up to the complete query.
///
/// Cost: a set costs one and a half times the length of its JSON. All sets stored since the last clear, including
/// replaced and expired ones, cost less than 2 MiB (2,097,152 bytes). Storing a set that would exceed this clears the
/// cache first. A set that alone costs 2 MiB is not stored.
///
/// The cache clears itself when the user's GUID, country, time zone, locale or the device's settings change, and under
/// memory pressure. It watches the pressure only while it holds a set.
///
/// Look-ups block until the cache's queue has run all earlier tasks; storing and clearing are asynchronous. Any thread
/// except the run loop's.
class QueryCache : public std::enable_shared_from_this<QueryCache> {
public:
    /// Creates an empty cache that observes the notifications of its assembly.
    [[nodiscard]] static std::shared_ptr<QueryCache> make(Assembly& assembly);
    explicit QueryCache(Assembly& assembly);

    /// Returns the best set for the request's text and scale, or null. Removes expired sets that it finds.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> getRequest(const TAVRequest& request);
    /// Returns the best set for a text at any scale, or null.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> get(std::string text);
    /// Stores the set under its query, in place of an earlier one. Ignores a set whose query is empty or contains a
    /// NUL. Ignores and logs a set whose input is longer than its query.
    void set(std::shared_ptr<const CachedResultSet> set);
    /// Calls `make` on the cache's queue, before any look-up that begins after this call, and stores the sets that it
    /// returns. If `removeAllObjects` or a notification has emptied the cache since `generation` was read, discards
    /// them: they belong to an earlier state of the user, the device or the client.
    void setMade(std::move_only_function<std::vector<std::shared_ptr<const CachedResultSet>>()> make,
                 std::uint64_t generation);
    /// Returns a number that changes whenever the answers to requests built before must no longer be stored.
    [[nodiscard]] std::uint64_t generation() const { return _generation; }
    /// Empties the cache asynchronously, and changes the generation at once.
    void removeAllObjects();
    /// Returns the number of sets, including expired ones. Blocks like a look-up.
    [[nodiscard]] std::size_t count() const;

private:
    void _cacheClearNotification();
    void _store(std::shared_ptr<const CachedResultSet> set);
    void _startListeningForMemoryPressure();

    Assembly& _assembly;
    std::atomic<std::uint64_t> _generation = 0;
    std::vector<platform::NotificationCenter::Token> _observers;
    std::shared_ptr<platform::Queue> _queue; // guards all below
    CachedResultSets _sets;
    std::unique_ptr<platform::MemoryPressure::Watch> _source;
};

} // namespace tavrin
