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

/// Aggregate statistics: named 64-bit counters. Any thread; an addition costs a hash look-up and an atomic add.
///
/// With a file, counts survive the process: they are read when made and written in batches, one minute after the
/// first change at the earliest, so an idle process doesn't wake for them. A kill loses at most that minute. Without a
/// file they live in memory.
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

    /// 0 for a counter that was never touched. For diagnostics and tests.
    [[nodiscard]] std::int64_t value(std::string_view key) const;
    [[nodiscard]] std::map<std::string, std::int64_t> snapshot() const;
    /// The counters as OpenMetrics text: one family, named `family`, each counter's name as the label "key".
    [[nodiscard]] std::string openMetrics(std::string_view family) const;

private:
    struct Impl;
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
