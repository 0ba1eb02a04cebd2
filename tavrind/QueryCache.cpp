#include "tavrind/QueryCache.h"

#include "CoreTavrin/TAVRequest.h"
#include "platform/device/Device.h"
#include "platform/run/Clock.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

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
    return _queue->sync(
        [&] { return _sets.find(request.queryString, request.scale, _assembly.device.clock.wallNow()); });
}

void QueryCache::set(std::shared_ptr<const CachedResultSet> set)
{
    _queue->async([self = shared_from_this(), set = std::move(set)]() mutable { self->_store(std::move(set)); });
}

void QueryCache::setMade(std::move_only_function<std::vector<std::shared_ptr<const CachedResultSet>>()> make,
                         std::uint64_t generation)
{
    _queue->async([self = shared_from_this(), make = std::move(make), generation]() mutable {
        for (auto& set : make())
            if (self->_generation == generation) self->_store(std::move(set));
    });
}

void QueryCache::_store(std::shared_ptr<const CachedResultSet> set)
{
    _queue->assertOnQueue();
    if (_sets.store(std::move(set)) && !_source) _startListeningForMemoryPressure();
}

void QueryCache::removeAllObjects()
{
    ++_generation;
    _queue->async([self = shared_from_this()] {
        self->_sets.clear();
        self->_source.reset();
    });
}

void QueryCache::_cacheClearNotification()
{
    removeAllObjects();
}

void QueryCache::_startListeningForMemoryPressure()
{
    _source = _assembly.device.memoryPressure.watch([weak = weak_from_this()] {
        auto self = weak.lock();
        if (!self) return;
        self->_queue->async([self] {
            if (!self->_source) return; // already cleared
            log(kLogCaching).log("emptying cache under memory pressure");
            self->_sets.clear();
            self->_source.reset();
        });
    });
}

std::size_t QueryCache::count() const
{
    return _queue->sync([this] { return _sets.count(); });
}

} // namespace tavrin
