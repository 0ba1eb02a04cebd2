#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <optional>
#include <string>

#include "platform/values/Value.h"
#include "tools/devserver/Http.h"
#include "tools/shared/Inflate.h"

namespace devserver {

/// An upload, unpacked and checked.
struct Upload {
    std::string path;
    std::string query;
    std::size_t packedSize = 0;
    std::size_t size = 0;               ///< bytes of the JSON text; 0 where the body could not be unpacked
    std::optional<std::string> digest;  ///< as the header has it
    bool digestFits = false;            ///< it is that of the JSON text
    platform::Value json;               ///< null where the text is none
    std::optional<std::string> problem; ///< the first thing that is wrong

    /// 200, or 400 with the problem.
    [[nodiscard]] Answer answer() const;
};

/// A body must be raw DEFLATE of JSON that fits the "X-Quorvane-Digest" header (SHA-512 of the JSON text, in
/// hexadecimal). At /feedback the JSON is a session (see `sessionShapeProblem`), elsewhere any object.
[[nodiscard]] Upload checkUpload(const Request& request);

/// What was uploaded: the last ones whole, and counts of all. Any thread.
class Uploads {
public:
    static constexpr std::size_t kKept = 100;
    /// Digests that are remembered, to tell repeats.
    static constexpr std::size_t kDigests = 10'000;

    /// Keeps an upload and what it was answered, and answers a line about both for people.
    std::string add(Upload upload, const Answer& answer);
    /// [{"number", "path", "query", "size", "packed_size", "digest", "digest_ok", "repeat", "status", "cut", "agent",
    /// "events", "error", "json"}], oldest first. "repeat" counts earlier uploads with the same digest, whatever those
    /// were answered; "status" and "cut" are the answer, after faults.
    [[nodiscard]] platform::Value list() const;
    /// {"received", "taken", "refused", "repeats", "events"}: of all since the start. Taken are those that were
    /// answered 200, whole; events are those in them, each upload counted once however often it was taken.
    [[nodiscard]] platform::Value totals() const;
    void clear();

private:
    /// How often a digest came, and how often it was taken.
    struct Seen {
        std::uint64_t received = 0, taken = 0;
    };
    struct Totals {
        std::uint64_t received = 0, taken = 0, repeats = 0, events = 0;
    };
    struct Kept {
        std::size_t size;
        platform::Value value;
    };
    Seen& _seen(const std::string& digest);

    mutable std::mutex _mutex;
    std::uint64_t _lastNumber = 0;
    Totals _totals;
    std::map<std::string, Seen> _digests;
    std::deque<std::string> _digestsByAge;
    std::size_t _keptBytes = 0; // unpacked
    std::deque<Kept> _kept;
};

} // namespace devserver
