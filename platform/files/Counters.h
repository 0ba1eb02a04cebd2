#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <string>
#include <string_view>

namespace platform {

class FileSystem;
class Queue;

/// Aggregate statistics: named 64-bit counters. Any thread; an addition costs a hash look-up and two atomic adds.
///
/// There are 4096 counters at most, with names of 512 bytes at most: names come from clients. A longer name isn't
/// counted; past the limit an eighth of the counters, those that were used least, make way for new ones.
///
/// With a file, counts survive the process: they are read when the store is made and written in batches, a minute after
/// the first change, so an idle process doesn't wake for them. A kill loses at most that minute, and nothing of what
/// `synchronize` has written. Without a file they live in memory.
class CounterStore {
public:
    CounterStore();
    CounterStore(FileSystem& files, std::filesystem::path path, std::shared_ptr<Queue> writeQueue);
    ~CounterStore();
    CounterStore(const CounterStore&) = delete;
    CounterStore& operator=(const CounterStore&) = delete;

    void add(std::string_view key, std::int64_t amount);
    void set(std::string_view key, std::int64_t value);
    void clear(std::string_view key);
    /// Writes the counters now, synced; does nothing without a file. A failure is logged, and they are written again
    /// with the next batch.
    void synchronize();

    /// Returns 0 for a counter that was never touched. For diagnostics and tests.
    [[nodiscard]] std::int64_t value(std::string_view key) const;
    [[nodiscard]] std::map<std::string, std::int64_t> snapshot() const;
    /// The counters as OpenMetrics text: one family, named `family`, each counter's name as the label "key".
    [[nodiscard]] std::string openMetrics(std::string_view family) const;

private:
    struct Impl;
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
