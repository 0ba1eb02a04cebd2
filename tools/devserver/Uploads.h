#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <string>

#include "platform/base/Mutex.h"
#include "platform/values/Value.h"
#include "tools/devserver/Http.h"
#include "tools/shared/Inflate.h"

namespace devserver {

/// A decompressed and checked upload.
struct Upload {
    std::string path;
    std::string query;
    std::size_t packedSize = 0;
    std::size_t size = 0;               ///< bytes of the JSON text; 0 if the body can't be decompressed
    std::optional<std::string> digest;  ///< the header's value
    bool digestFits = false;            ///< whether it is the digest of the JSON text
    platform::Value json;               ///< null if the text isn't JSON
    std::optional<std::string> problem; ///< the first problem found

    /// Returns status 200, or 400 with the problem as its text.
    [[nodiscard]] Answer answer() const;
};

/// Checks an upload. The body must be raw DEFLATE of JSON, and "X-Quorvane-Digest" the SHA-512 of the JSON text in
/// hexadecimal. At /feedback the JSON must be a session (`sessionShapeProblem`), elsewhere any object.
[[nodiscard]] Upload checkUpload(const Request& request);

/// The received uploads: the contents of the last ones, and counts of all. Any thread.
class Uploads {
public:
    static constexpr std::size_t kKept = 100;
    /// Digests remembered to recognise repeats.
    static constexpr std::size_t kDigests = 10'000;

    /// Stores an upload with its answer; returns a line about both, for people.
    std::string add(Upload upload, const Answer& answer);
    /// Returns [{"number", "path", "query", "size", "packed_size", "digest", "digest_ok", "repeat", "status", "cut",
    /// "agent", "events", "searches", "error", "json"}], oldest first. "repeat" is the number of earlier uploads with
    /// the same digest, regardless of their answer. "status" and "cut" describe the answer after faults. "searches" has
    /// the session's `searchFigures`.
    [[nodiscard]] platform::Value list() const;
    /// Returns the list without "json".
    [[nodiscard]] platform::Value summaries() const;
    /// Returns the upload with that number; null if it isn't kept.
    [[nodiscard]] platform::Value find(std::uint64_t number) const;
    /// Returns {"received", "taken", "refused", "repeats", "events", "recorded"}: counts since the start or `clear`. An
    /// upload is taken if its answer had status 200, even if the rest was cut: devices count it as sent. "events" has
    /// the events of taken uploads, once for each digest; "recorded" leaves out those that a device makes when it
    /// uploads, as its books do.
    [[nodiscard]] platform::Value totals() const;
    void clear();

private:
    /// How often a digest was received, and how often it was taken.
    struct Seen {
        std::uint64_t received = 0, taken = 0;
    };
    struct Totals {
        std::uint64_t received = 0, taken = 0, repeats = 0, events = 0, recorded = 0;
    };
    struct Kept {
        std::size_t size;
        platform::Value value;
    };
    Seen& _seen(const std::string& digest) REQUIRES(_mutex);

    mutable platform::Mutex _mutex;
    std::uint64_t _lastNumber GUARDED_BY(_mutex) = 0;
    Totals _totals GUARDED_BY(_mutex);
    std::map<std::string, Seen> _digests GUARDED_BY(_mutex);
    std::deque<std::string> _digestsByAge GUARDED_BY(_mutex);
    std::size_t _keptBytes GUARDED_BY(_mutex) = 0; // decompressed
    std::deque<Kept> _kept GUARDED_BY(_mutex);
};

} // namespace devserver
