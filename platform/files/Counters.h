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
/// Names come from clients, so there are limits: 4096 counters, names of 512 bytes. A counter with a longer name is
/// ignored. At the limit of counters, the eighth that was used least is removed.
///
/// With a file, counts survive the process: the constructor reads them, and a batch is written one minute after its
/// first change, so that an idle process doesn't wake up. A kill loses at most that minute. Without a file, counters
/// are in memory only.
class CounterStore {
public:
    /// Creates a store in memory only.
    CounterStore();
    /// Reads the file at `path`; starts empty if it is missing or damaged, which is logged. `writeQueue` runs the
    /// writes. `files` must outlive the queue's work.
    CounterStore(FileSystem& files, std::filesystem::path path, std::shared_ptr<Queue> writeQueue);
    ~CounterStore();
    CounterStore(const CounterStore&) = delete;
    CounterStore& operator=(const CounterStore&) = delete;

    void add(std::string_view key, std::int64_t amount);
    void set(std::string_view key, std::int64_t value);
    void clear(std::string_view key);
    /// Writes and syncs the counters before it returns; does nothing without a file. Logs a failure; the next batch
    /// writes them again.
    void synchronize();

    /// Returns 0 for an unknown counter. For diagnostics and tests.
    [[nodiscard]] std::int64_t value(std::string_view key) const;
    [[nodiscard]] std::map<std::string, std::int64_t> snapshot() const;
    /// Returns the counters in OpenMetrics text format: one family, named `family`, with the counter's name as the
    /// label "key".
    [[nodiscard]] std::string openMetrics(std::string_view family) const;

private:
    struct Impl;
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
