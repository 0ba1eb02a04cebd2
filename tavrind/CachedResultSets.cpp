#include "tavrind/CachedResultSets.h"

#include <string>

#include <fmt/format.h>

#include "platform/text/Text.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Private;

namespace {

constexpr std::size_t kMaximumCost = 0x200000;

std::size_t costOf(const CachedResultSet& set)
{
    return static_cast<std::size_t>(static_cast<double>(set.resultSetSize()) * 1.5);
}

bool canBeFound(const CachedResultSet& set)
{
    if (set.query.empty() || set.query.contains('\0')) return false;
    if (set.inputLength <= set.queryLength) return true;
    log(kLogCaching)
        .error("BUG: NOT caching '{}' because input is longer than completed query '{}'", Private{set.input},
               Private{set.query});
    return false;
}

} // namespace

std::shared_ptr<const CachedResultSet> CachedResultSets::find(std::string_view text, double scale, platform::Date now)
{
    const std::string key = platform::lowerCased(text);
    const std::size_t keyLength = platform::utf16Length(key);
    log(kLogCaching).debug("cache lookup: {}", key);
    const float sent = scaleAsSent(scale);
    std::vector<std::string> expired;
    std::vector<const CachedResultSet*> candidates;
    _tree.keysMatchingPrefix(key, [&](std::string_view query, const CachedResultSet& set, bool&) {
        const CachedUse use = useOf(set, keyLength, sent, now);
        if (use == CachedUse::Expired) expired.emplace_back(query);
        if (use == CachedUse::Candidate) candidates.push_back(&set);
    });
    for (const std::string& query : expired) _tree.removeObjectForKey(query);

    for (const CachedResultSet* set : candidates)
        log(kLogCaching)
            .debug("entry {} prefix: {} input: {} score: {:f}", fmt::ptr(set), key, set->input, set->completionScore);
    const CachedResultSet* pick = pickCompletion(candidates);
    return pick ? pick->shared_from_this() : nullptr;
}

bool CachedResultSets::store(std::shared_ptr<const CachedResultSet> set)
{
    if (!canBeFound(*set)) return false;
    const std::size_t cost = costOf(*set);
    if (cost >= kMaximumCost) {
        log(kLogCaching).error("NOT caching '{}' with cost {}", Private{set->query}, cost);
        return false;
    }
    log(kLogCaching).log("caching '{}' with cost {}", Private{set->query}, cost);
    if (_currentCost + cost >= kMaximumCost) {
        log(kLogCaching).log("!!! exceeded max cost, flushing cache !!!");
        clear();
    }
    _tree.setObject(*set, set->query);
    _stored.push_back(std::move(set));
    _currentCost += cost;
    return true;
}

void CachedResultSets::clear()
{
    _tree.removeAllObjects();
    _stored.clear();
    _currentCost = 0;
}

} // namespace tavrin
