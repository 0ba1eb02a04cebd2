#include "platform/files/Counters.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <unordered_map>
#include <vector>

#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {

namespace {

constexpr std::chrono::seconds kBatch{60};
/// Keys contain clients' names and agents: a hostile client must not exhaust memory.
constexpr std::size_t kMaximumCounters = 4096;
/// Evicted at once, to spread the cost of finding the least used.
constexpr std::size_t kEvicted = kMaximumCounters / 8;
constexpr std::size_t kMaximumKeyLength = 512;
/// The size of the largest file that can be written: all keys consist of escapes ("\u0001"), all numbers of 20 digits.
constexpr std::size_t kMaximumCountersSize = kMaximumCounters * (6 * kMaximumKeyLength + 32);

struct KeyHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view key) const { return std::hash<std::string_view>()(key); }
};

} // namespace

struct CounterStore::Impl : std::enable_shared_from_this<Impl> {
    FileSystem* files = nullptr; // null: in memory only
    std::filesystem::path path;
    std::shared_ptr<Queue> writeQueue;

    struct Counter {
        explicit Counter(std::int64_t value_)
            : value(value_), uses(static_cast<std::uint64_t>(std::max<std::int64_t>(value_, 0)))
        {}
        std::atomic<std::int64_t> value;
        std::atomic<std::uint64_t> uses; ///< starts at the value that the file has
    };

    mutable SharedMutex mutex;
    std::unordered_map<std::string, Counter, KeyHash, std::equal_to<>> counters GUARDED_BY(mutex);
    std::atomic<bool> writeQueued = false;
    Mutex writing;                           // orders writers: an older snapshot must not overwrite a newer one
    bool unread GUARDED_BY(writing) = false; // the file's counts are still to be added

    /// Calls `change` with the counter's value; creates the counter if it is missing.
    template <class Change> void with(std::string_view key, Change change)
    {
        if (withExisting(key, change)) return changed();
        if (key.size() > kMaximumKeyLength) return;
        {
            MutexLock lock(mutex);
            if (counters.size() >= kMaximumCounters && !counters.contains(key)) evict();
            Counter& counter = counters.try_emplace(std::string(key), 0).first->second;
            change(counter.value);
            ++counter.uses;
        }
        changed();
    }

    /// Calls `change` with the value of an existing counter; returns false if the counter is missing.
    template <class Change> [[nodiscard]] bool withExisting(std::string_view key, Change& change)
    {
        SharedMutexLock lock(mutex);
        const auto found = counters.find(key);
        if (found == counters.end()) return false;
        change(found->second.value);
        found->second.uses.fetch_add(1, std::memory_order_relaxed);
        return true;
    }

    /// Removes the least used counters.
    void evict() REQUIRES(mutex)
    {
        std::vector<std::pair<std::uint64_t, std::string_view>> byUse;
        byUse.reserve(counters.size());
        for (const auto& [key, counter] : counters) byUse.emplace_back(counter.uses.load(), key);
        std::ranges::nth_element(byUse, byUse.begin() + kEvicted);
        byUse.resize(kEvicted);
        for (const auto& [uses, key] : byUse) counters.erase(counters.find(key));
    }

    void changed()
    {
        if (!files || writeQueued.exchange(true)) return;
        writeQueue->after(kBatch, [self = shared_from_this()] {
            self->writeQueued = false;
            self->write();
        });
    }

    std::map<std::string, std::int64_t> snapshot() const
    {
        std::map<std::string, std::int64_t> all;
        SharedMutexLock lock(mutex);
        for (const auto& [key, counter] : counters) all.emplace(key, counter.value.load());
        return all;
    }

    void write()
    {
        const MutexLock writer(writing);
        if (unread) load();
        if (unread) return; // what the file counts must not be overwritten
        Dictionary contents;
        for (const auto& [key, count] : snapshot()) contents.set(key, count);
        auto made = files->createDirectories(path.parent_path());
        auto written = made ? files->writeAtomically(path, toJson(contents)) : std::move(made);
        if (!written) defaultLog().error("counters can't be written: {}", written.error().description());
    }

    void load() REQUIRES(writing)
    {
        auto bytes = files->read(path, kMaximumCountersSize);
        unread = !bytes && mayPass(bytes.error());
        if (!bytes) {
            if (bytes.error().code != ENOENT)
                defaultLog().error("counters can't be read: {}", bytes.error().description());
            return;
        }
        const auto contents = parseJson(bytes->view(), kMaximumCountersSize);
        if (!contents || !contents->asDictionary())
            return defaultLog().error("counters {} are damaged, starting at 0", path.string());
        MutexLock lock(mutex);
        for (const auto& [key, count] : *contents->asDictionary())
            if (const auto number = count.asInt(); number && counters.size() < kMaximumCounters)
                if (const auto [found, isNew] = counters.try_emplace(key, *number); !isNew)
                    found->second.value += *number;
    }
};

CounterStore::CounterStore() : _impl(std::make_shared<Impl>()) {}

CounterStore::CounterStore(FileSystem& files, std::filesystem::path path, std::shared_ptr<Queue> writeQueue)
    : CounterStore()
{
    _impl->files = &files;
    _impl->path = std::move(path);
    _impl->writeQueue = std::move(writeQueue);
    const MutexLock loading(_impl->writing);
    _impl->load();
}

CounterStore::~CounterStore() = default;

void CounterStore::add(std::string_view key, std::int64_t amount)
{
    _impl->with(key, [amount](auto& counter) { counter.fetch_add(amount, std::memory_order_relaxed); });
}

void CounterStore::set(std::string_view key, std::int64_t value)
{
    _impl->with(key, [value](auto& counter) { counter = value; });
}

void CounterStore::clear(std::string_view key)
{
    {
        MutexLock lock(_impl->mutex);
        const auto found = _impl->counters.find(key);
        if (found == _impl->counters.end()) return;
        _impl->counters.erase(found);
    }
    _impl->changed();
}

void CounterStore::synchronize()
{
    if (_impl->files) _impl->write();
}

std::int64_t CounterStore::value(std::string_view key) const
{
    SharedMutexLock lock(_impl->mutex);
    const auto found = _impl->counters.find(key);
    return found == _impl->counters.end() ? 0 : found->second.value.load();
}

std::map<std::string, std::int64_t> CounterStore::snapshot() const
{
    return _impl->snapshot();
}

std::string CounterStore::openMetrics(std::string_view family) const
{
    std::string text = fmt::format("# TYPE {} unknown\n", family);
    for (const auto& [key, count] : snapshot()) {
        std::string label;
        for (const char c : key) {
            if (c == '\n')
                label += "\\n";
            else if (c == '"' || c == '\\')
                label += {'\\', c};
            else
                label += c;
        }
        text += fmt::format("{}{{key=\"{}\"}} {}\n", family, label, count);
    }
    return text + "# EOF\n";
}

} // namespace platform
