#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <mutex>

#include "platform/Value.h"
#include "tools/devserver/Http.h"

namespace devserver {

/// Feedback that was uploaded: the last ones, unpacked and checked. Any thread.
class Uploads {
public:
    static constexpr std::size_t kKept = 100;
    static constexpr std::size_t kMaximumUnpacked = 32u << 20;

    /// 200 for a body of raw DEFLATE that holds JSON and fits the "X-Quorvane-Digest" header (SHA-512 of the JSON text,
    /// in hexadecimal); else 400 with what is wrong. Both are kept.
    Answer receive(const Request& request);
    /// [{"number", "path", "size", "packed_size", "digest", "error", "json"}], oldest first.
    [[nodiscard]] platform::Value list() const;
    void clear();

private:
    mutable std::mutex _mutex;
    std::uint64_t _count = 0;
    std::size_t _keptBytes = 0; // unpacked
    std::deque<std::pair<std::size_t, platform::Value>> _kept;
};

} // namespace devserver
