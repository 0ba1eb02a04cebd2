#pragma once

#include <cstddef>
#include <memory>
#include <string_view>
#include <vector>

#include "tavrind/CachedResultSet.h"
#include "tavrind/CritbitTree.h"

namespace tavrin {

/// The sets of a query cache, by their queries. `QueryCache` has the rules of their use and their cost.
///
/// Has no clock and no queue. Not thread-safe.
class CachedResultSets {
public:
    /// Returns the best set for a typed text, or null. Removes expired sets that it finds. `scale` is the client's
    /// screen scale; 0 accepts any set.
    [[nodiscard]] std::shared_ptr<const CachedResultSet> find(std::string_view text, double scale, platform::Date now);
    /// Stores the set under its query, in place of an earlier one. Returns false if it may not be stored.
    bool store(std::shared_ptr<const CachedResultSet> set);
    void clear();
    /// Returns the number of sets, including expired ones.
    [[nodiscard]] std::size_t count() const { return _tree.count(); }

private:
    CritbitTree<const CachedResultSet> _tree;
    std::vector<std::shared_ptr<const CachedResultSet>> _stored; // owns the tree's sets, and replaced ones
    std::size_t _currentCost = 0;
};

} // namespace tavrin
