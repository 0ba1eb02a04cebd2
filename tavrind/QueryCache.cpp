#include "tavrind/QueryCache.h"

#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
#include "platform/device/Device.h"
#include "platform/run/Clock.h"
#include "platform/text/Text.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using platform::Private;

namespace {

constexpr std::size_t kMaximumCost = 0x200000;

std::size_t costOf(const CachedResultSet& set)
{
    return static_cast<std::size_t>(static_cast<double>(set.resultSetSize()) * 1.5);
}

} // namespace

std::shared_ptr<QueryCache> QueryCache::make(Assembly& assembly)
{
    auto cache = std::make_shared<QueryCache>(assembly);
    for (const char* name :
         {TAVUserGUIDChangeNotification, TAVCountryCodeChangeNotification, TAVTimeZoneChangeNotification,
          TAVLocaleChangeNotification, TAVEffectiveSettingsChangeNotification}) {
        cache->_observers.push_back(assembly.notificationCenter.observe(name, [weak = cache->weak_from_this()](auto&) {
            if (auto self = weak.lock()) self->_cacheClearNotification();
        }));
    }
    return cache;
}

QueryCache::QueryCache(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrin.queryCache", rank::kStore))
{}

std::shared_ptr<const CachedResultSet> QueryCache::get(std::string text)
{
    return getRequest(*TAVSearchRequest::searchRequestWithString(std::move(text), StartSearchTrigger::Unknown));
}

std::shared_ptr<const CachedResultSet> QueryCache::getRequest(const TAVRequest& request)
{
    const std::string key = platform::lowerCased(request.queryString);
    const std::size_t keyLength = platform::utf16Length(key);
    log(kLogCaching).debug("cache lookup: {}", key);
    return _queue->sync([&]() -> std::shared_ptr<const CachedResultSet> {
        const platform::Date now = _assembly.device.clock.wallNow();
        std::vector<std::string> expired;
        std::vector<const CachedResultSet*> candidates;
        _tree.keysMatchingPrefix(key, [&](std::string_view query, const CachedResultSet& set, bool&) {
            const CachedUse use = useOf(set, keyLength, request.scale, now);
            if (use == CachedUse::Expired) expired.emplace_back(query);
            if (use == CachedUse::Candidate) candidates.push_back(&set);
        });
        for (const std::string& query : expired) _tree.removeObjectForKey(query);

        for (const CachedResultSet* set : candidates)
            log(kLogCaching)
                .debug("entry {} prefix: {} input: {} score: {:f}", fmt::ptr(set), key, set->input,
                       set->completionScore);
        const CachedResultSet* pick = pickCompletion(candidates);
        return pick ? pick->shared_from_this() : nullptr;
    });
}

bool QueryCache::_isKept(const CachedResultSet& set)
{
    if (set.query.empty() || set.query.contains('\0')) return false;
    if (set.inputLength <= set.queryLength) return true;
    log(kLogCaching)
        .error("BUG: NOT caching '{}' because input is longer than completed query '{}'", Private{set.input},
               Private{set.query});
    return false;
}

void QueryCache::set(std::shared_ptr<const CachedResultSet> set)
{
    if (_isKept(*set))
        _queue->async([self = shared_from_this(), set = std::move(set)]() mutable { self->_store(std::move(set)); });
}

void QueryCache::setMade(std::move_only_function<std::vector<std::shared_ptr<const CachedResultSet>>()> make,
                         std::uint64_t generation)
{
    _queue->async([self = shared_from_this(), make = std::move(make), generation]() mutable {
        for (auto& set : make())
            if (self->_generation == generation && _isKept(*set)) self->_store(std::move(set));
    });
}

void QueryCache::_store(std::shared_ptr<const CachedResultSet> set)
{
    _queue->assertOnQueue();
    const std::size_t cost = costOf(*set);
    if (cost >= kMaximumCost) return log(kLogCaching).error("NOT caching '{}' with cost {}", Private{set->query}, cost);
    log(kLogCaching).log("caching '{}' with cost {}", Private{set->query}, cost);
    if (_currentCost + cost >= kMaximumCost) {
        log(kLogCaching).log("!!! exceeded max cost, flushing cache !!!");
        _clearCache();
    }
    if (!_source) _startListeningForMemoryPressure();
    _tree.setObject(*set, set->query);
    _stored.push_back(std::move(set));
    _currentCost += cost;
}

void QueryCache::removeAllObjects()
{
    ++_generation;
    _queue->async([self = shared_from_this()] {
        self->_clearCache();
        self->_source.reset();
    });
}

void QueryCache::_cacheClearNotification()
{
    removeAllObjects();
}

void QueryCache::_clearCache()
{
    _queue->assertOnQueue();
    _tree.removeAllObjects();
    _stored.clear();
    _currentCost = 0;
}

void QueryCache::_startListeningForMemoryPressure()
{
    _source = _assembly.device.memoryPressure.watch([weak = weak_from_this()] {
        auto self = weak.lock();
        if (!self) return;
        self->_queue->async([self] {
            if (!self->_source) return; // already cleared
            log(kLogCaching).log("emptying cache under memory pressure");
            self->_clearCache();
            self->_source.reset();
        });
    });
}

std::size_t QueryCache::count() const
{
    return _queue->sync([this] { return _tree.count(); });
}

} // namespace tavrin
