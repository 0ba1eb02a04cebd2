#pragma once

#include <cstddef>
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

/// Answers from memory for a client who types on: a result set for the query "weather today", fetched when "wea" had
/// been typed, answers "wea", "weat" and so on to its end.
///
/// The cost of a set is its length as JSON and half as much again. What was stored since the last clearing costs less
/// than 2 MiB in all, what was replaced or has expired included: it is kept till then. What would go beyond it clears
/// the cache first; what alone costs as much isn't stored. The cache clears itself too when the user's GUID, country,
/// time zone, locale or the device's settings change, and when memory runs short, which it watches only while it holds
/// something.
///
/// A look-up waits its turn; storing and clearing don't. Not on the run loop's thread; else any.
class QueryCache : public std::enable_shared_from_this<QueryCache> {
public:
    /// An empty cache that follows the notifications.
    [[nodiscard]] static std::shared_ptr<QueryCache> make(Assembly& assembly);
    explicit QueryCache(Assembly& assembly);

    /// The set that answers the request's text, for its scale; null for none. Expired ones that could have are dropped.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> getRequest(const TAVRequest& request);
    /// The same for a text, on any scale.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> get(std::string text);
    /// Stores the set under its query, in place of what is there. One without a query, or whose query holds a NUL, is
    /// ignored.
    void set(std::shared_ptr<const CachedResultSet> set);
    void removeAllObjects();
    [[nodiscard]] std::size_t count() const;

private:
    void _cacheClearNotification();
    void _store(std::shared_ptr<const CachedResultSet> set);
    void _clearCache();
    void _startListeningForMemoryPressure();

    Assembly& _assembly;
    std::vector<platform::NotificationCenter::Token> _observers;
    std::shared_ptr<platform::Queue> _queue; // guards all below
    CritbitTree<const CachedResultSet> _tree;
    std::vector<std::shared_ptr<const CachedResultSet>> _stored; // since the last clearing; keeps what the tree holds
    std::size_t _currentCost = 0;
    std::unique_ptr<platform::MemoryPressure::Watch> _source;
};

} // namespace tavrin
