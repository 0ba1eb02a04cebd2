#include "platform/net/HttpCache.h"

#include <list>
#include <string>
#include <string_view>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/net/HttpCacheStore.h"
#include "platform/run/Clock.h"
#include "platform/run/Queue.h"

namespace platform {

namespace {

using Stored = std::shared_ptr<const StoredResponse>;

/// Delay before a directory that could not be opened is tried again.
constexpr Duration kRetryDelay = std::chrono::minutes(1);
/// A response takes at most a capacity divided by this, so that it can't evict all others.
constexpr std::size_t kLargestPart = 10;
/// Limit of the bytes that wait to be written. Beyond it responses are not stored on disk, so that a slow disk can't
/// exhaust memory.
constexpr std::size_t kMostWaiting = 64u << 20;

std::size_t sizeOf(const std::string& key, const StoredResponse& stored)
{
    constexpr std::size_t kEntrySize = 512; // estimate of the structures
    std::size_t size = kEntrySize + 2 * key.size() + stored.selecting.size() + stored.body.size();
    for (const auto& [name, value] : stored.response.headers) size += name.size() + value.size() + 2 * sizeof(name);
    return size;
}

/// The responses in memory, most recently used first. Guarded by the cache's mutex.
class MemoryCache {
public:
    explicit MemoryCache(std::size_t capacity) : _capacity(capacity) {}

    [[nodiscard]] Stored find(const std::string& key)
    {
        const auto found = _byKey.find(key);
        if (found == _byKey.end()) return nullptr;
        _entries.splice(_entries.begin(), _entries, found->second);
        found->second->used = true;
        return found->second->stored;
    }
    /// Stores a response unless it is too large; removes the earlier one in either case.
    void put(const std::string& key, Stored stored)
    {
        remove(key);
        const std::size_t size = sizeOf(key, *stored);
        if (size > _capacity / kLargestPart) return;
        while (_size + size > _capacity) drop(std::prev(_entries.end()));
        _entries.push_front({key, std::move(stored), size});
        _byKey.emplace(_entries.front().key, _entries.begin());
        _size += size;
    }
    void remove(const std::string& key)
    {
        if (const auto found = _byKey.find(key); found != _byKey.end()) drop(found->second);
    }
    /// Returns the keys of the entries that were found since the last call, the most recent last.
    [[nodiscard]] std::vector<std::string> takeUsed()
    {
        std::vector<std::string> keys;
        for (auto entry = _entries.rbegin(); entry != _entries.rend(); ++entry)
            if (std::exchange(entry->used, false)) keys.push_back(entry->key);
        return keys;
    }

private:
    struct Entry {
        std::string key;
        Stored stored;
        std::size_t size;
        bool used = false;
    };
    void drop(std::list<Entry>::iterator entry)
    {
        _size -= entry->size;
        _byKey.erase(entry->key);
        _entries.erase(entry);
    }

    const std::size_t _capacity;
    std::size_t _size = 0;
    std::list<Entry> _entries;
    std::unordered_map<std::string_view, std::list<Entry>::iterator> _byKey; // of the entries' own keys
};

} // namespace

/// Changes of the disk run in the order of the calls: each is queued under the mutex. Memory is newer than the disk
/// while changes are pending, so an entry with a pending change is not copied from disk to memory.
struct HttpCache::Impl : std::enable_shared_from_this<Impl> {
    explicit Impl(HttpCacheConfiguration configuration_)
        : configuration(std::move(configuration_)), memory(configuration.memoryCapacity)
    {}

    Stored find(const Url& url)
    {
        const std::string key = cacheKey(url);
        if (Stored stored; decidedWithoutDisk(key, stored)) return stored;
        return configuration.queue->sync([&] { return readFromDisk(key, url); });
    }

    void lookUp(const Url& url, Found found)
    {
        std::string key = cacheKey(url);
        if (Stored stored; decidedWithoutDisk(key, stored)) return found(std::move(stored));
        configuration.queue->async([self = shared_from_this(), key = std::move(key), url,
                                    found = std::move(found)]() mutable { found(self->readFromDisk(key, url)); });
    }

    void put(std::string key, StoredResponse stored)
    {
        const Stored shared = std::make_shared<const StoredResponse>(std::move(stored));

        MutexLock lock(mutex);
        memory.put(key, shared);
        if (!hasDisk()) return;
        const std::size_t size = sizeOf(key, *shared);
        if (shared->body.size() > configuration.diskCapacity / kLargestPart || waitingBytes + size > kMostWaiting)
            return removeLater(std::move(key));
        change(hash(key), size, [self = shared_from_this(), key, shared] { self->writeToDisk(key, *shared); });
    }

    void remove(std::string key)
    {
        MutexLock lock(mutex);
        memory.remove(key);
        if (hasDisk()) removeLater(std::move(key));
    }

    const HttpCacheConfiguration configuration;

private:
    [[nodiscard]] bool hasDisk() const { return configuration.files && !configuration.directory.empty(); }
    [[nodiscard]] static std::size_t hash(const std::string& key) { return std::hash<std::string>()(key); }

    /// Returns true if the key may be on disk, now or after pending changes.
    [[nodiscard]] bool mayBeOnDisk(const std::string& key) const REQUIRES(mutex)
    {
        return !onDisk || onDisk->contains(hash(key)) || changing.contains(hash(key));
    }
    /// Queues a change of the disk. `keyHash` is the hash of its key; the change holds `bytes` until it is done.
    void change(std::size_t keyHash, std::size_t bytes, Queue::Task work) REQUIRES(mutex)
    {
        changing.insert(keyHash);
        waitingBytes += bytes;
        configuration.queue->async([self = shared_from_this(), keyHash, bytes, work = std::move(work)]() mutable {
            work();
            MutexLock lock(self->mutex);
            self->changing.erase(self->changing.find(keyHash));
            self->waitingBytes -= bytes;
        });
    }
    void removeLater(std::string key) REQUIRES(mutex)
    {
        if (!mayBeOnDisk(key)) return;
        const std::size_t keyHash = hash(key);
        change(keyHash, 0, [self = shared_from_this(), key = std::move(key)] { self->removeFromDisk(key); });
    }
    void forgetOnDisk(const std::string& key) REQUIRES(mutex)
    {
        if (onDisk) onDisk->erase(hash(key));
    }

    // Any thread.

    /// Returns true if the disk need not be read; `stored` is then the result.
    [[nodiscard]] bool decidedWithoutDisk(const std::string& key, Stored& stored)
    {
        MutexLock lock(mutex);
        stored = memory.find(key);
        return stored || !hasDisk() || !mayBeOnDisk(key);
    }

    // On the queue.

    [[nodiscard]] Stored readFromDisk(const std::string& key, const Url& url)
    {
        if (!openStore()) return nullptr;
        auto found = store->find(key, url);
        if (!found) {
            failed(found.error());
            return nullptr;
        }
        MutexLock lock(mutex);
        if (!*found)
            forgetOnDisk(key);
        else if (!(*found)->mapped && !changing.contains(hash(key)))
            memory.put(key, *found);
        return *found;
    }

    void writeToDisk(const std::string& key, const StoredResponse& stored)
    {
        if (store && !store->isInPlace()) {
            defaultLog().error("the HTTP cache {} was removed by another process", configuration.directory.string());
            closeStore();
        }
        if (openStore()) {
            noteUses();
            auto evicted = store->put(key, stored);
            if (!evicted && Sqlite::isDamage(evicted.error())) {
                failed(evicted.error()); // replaces the index by an empty one
                if (store) evicted = store->put(key, stored);
            }
            if (evicted) {
                failing = false;
                MutexLock lock(mutex);
                onDisk->insert(hash(key));
                for (const std::string& other : *evicted) forgetOnDisk(other);
                return;
            }
            if (store) {
                // An earlier answer must not outlive the one that took its place.
                (void)store->remove(key);
                failed(evicted.error());
            }
        }
        MutexLock lock(mutex);
        forgetOnDisk(key);
    }

    void removeFromDisk(const std::string& key)
    {
        if (!openStore()) return;
        if (auto removed = store->remove(key); !removed) failed(removed.error());
        MutexLock lock(mutex);
        forgetOnDisk(key);
    }

    void noteUses()
    {
        std::vector<std::string> used;
        {
            MutexLock lock(mutex);
            used = memory.takeUsed();
        }
        for (const std::string& key : used) store->noteUse(key);
    }

    [[nodiscard]] bool openStore()
    {
        if (store) return true;
        const std::uint64_t now = configuration.clock ? configuration.clock->hostTicks() : 0;
        if (closed && now < nextAttempt) return false;
        nextAttempt = now + static_cast<std::uint64_t>(kRetryDelay.count());
        auto opened = HttpCacheStore::open(
            *configuration.files, configuration.directory,
            {.capacity = configuration.diskCapacity, .minimumMappedSize = configuration.minimumMappedSize});
        auto keys = opened ? (*opened)->keys() : std::unexpected(opened.error());
        if (opened && !keys && Sqlite::isDamage(keys.error())) {
            logFailure(keys.error());
            if ((*opened)->reset()) keys = (*opened)->keys();
        }
        if (!keys) {
            logFailure(keys.error());
            closeStore();
            closed = true;
            return false;
        }
        std::unordered_set<std::size_t> hashes;
        for (const std::string& key : *keys) hashes.insert(hash(key));
        store = std::move(*opened);
        closed = false;
        MutexLock lock(mutex);
        onDisk = std::move(hashes);
        return true;
    }

    void closeStore()
    {
        store.reset();
        MutexLock lock(mutex);
        onDisk.emplace();
    }

    void failed(const Error& error)
    {
        logFailure(error);
        if (!Sqlite::isDamage(error)) return;
        if (auto begun = store->reset(); !begun) {
            logFailure(begun.error());
            closeStore();
            closed = true;
        }
    }

    /// Logs once until a write succeeds again.
    void logFailure(const Error& error)
    {
        if (!std::exchange(failing, true))
            defaultLog().error("the HTTP cache {} can't be used: {}", configuration.directory.string(),
                               error.description());
    }

    Mutex mutex;
    MemoryCache memory GUARDED_BY(mutex);
    /// Hashes of the keys, possibly more; empty until the directory was opened.
    std::optional<std::unordered_set<std::size_t>> onDisk GUARDED_BY(mutex);
    /// Key hashes of pending and running changes.
    std::unordered_multiset<std::size_t> changing GUARDED_BY(mutex);
    std::size_t waitingBytes GUARDED_BY(mutex) = 0; ///< bytes that those hold
    std::unique_ptr<HttpCacheStore> store;          // queue
    bool closed = false;                            // queue: it could not be opened
    std::uint64_t nextAttempt = 0;                  // queue: host ticks
    bool failing = false;                           // queue
};

HttpCache::HttpCache(std::shared_ptr<Impl> impl) : _impl(std::move(impl)) {}
HttpCache::~HttpCache() = default;

std::shared_ptr<HttpCache> HttpCache::make(HttpCacheConfiguration configuration)
{
    return std::shared_ptr<HttpCache>(new HttpCache(std::make_shared<Impl>(std::move(configuration))));
}

std::optional<CachedResponse> HttpCache::find(const Url& url)
{
    const Stored stored = _impl->find(url);
    return stored ? std::optional<CachedResponse>(*stored) : std::nullopt;
}

void HttpCache::store(const Url& url, UrlResponse response, Bytes body)
{
    StoredResponse stored;
    stored.response = std::move(response);
    stored.body = std::move(body);
    stored.requested = stored.received = now();
    store(url, std::move(stored));
}

void HttpCache::store(const Url& url, StoredResponse stored)
{
    _impl->put(cacheKey(url), std::move(stored));
}

void HttpCache::remove(const Url& url)
{
    _impl->remove(cacheKey(url));
}

void HttpCache::lookUp(const Url& url, Found found)
{
    _impl->lookUp(url, std::move(found));
}

Date HttpCache::now() const
{
    return _impl->configuration.clock ? _impl->configuration.clock->wallNow() : Date();
}

} // namespace platform
