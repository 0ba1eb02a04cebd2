#pragma once

#include <array>
#include <cstdint>
#include <deque>
#include <filesystem>
#include <memory>
#include <string>

#include "platform/base/Mutex.h"
#include "platform/values/Value.h"

namespace platform {
class FileSystem;
class Queue;
} // namespace platform

namespace tavrin {

/// Where a recorded event is, or how it ended.
enum class FeedbackFate : std::uint8_t {
    Open,      ///< in an open session, or waiting to be sent on its own
    Closed,    ///< in a closed session file
    Uploading, ///< in an upload that has not ended
    Sent,      ///< accepted by the service
    NotSent,   ///< in an upload that failed
    Unknown,   ///< pending when an earlier process ended, and not found since
    // The rest are reasons for a drop.
    FeedbackOff,   ///< the bag disables feedback
    NoContainer,   ///< the session has no file, or there are too many sessions
    RefusedAppend, ///< it did not fit into the session's file or could not be written
    FileTooBig,    ///< the session's file was too large to be read
    TooOld,        ///< the session's file was too old
    Unreadable,    ///< the session's file could not be read
    OtherVersion,  ///< another version of the daemon wrote the session's file
    DamagedTail,   ///< it was after a damaged record
    NotJson,       ///< it could not be written as JSON
    NoBody,        ///< the upload's body could not be written
    NoTask,        ///< the upload could not be created
    EndpointUnset, ///< there was no endpoint
    BufferFull,    ///< too many were waiting to be sent
};
inline constexpr std::size_t kFeedbackFates = static_cast<std::size_t>(FeedbackFate::BufferFull) + 1;

/// The accounts of the feedback pipeline, in events. Every recorded event is in exactly one place: `recorded` is always
/// the sum over all fates.
///
/// The books outlive the process. They are saved when events move between files (a session is closed, read, uploaded),
/// not with every event. A new process counts all pending events as unknown, then moves those that it finds in session
/// files and unfinished uploads to their places. Any further ones were written after the last save; they count as
/// recorded. Events are only counted, not identified: an event written after the last save can make up for a lost one.
/// Any thread.
class FeedbackBooks {
public:
    /// Reads `path`; a damaged file is logged and replaced. If reading fails for a reason that may pass, `save` tries
    /// it again and adds the counts. `queue` (serial) runs `saveSoon`.
    FeedbackBooks(platform::FileSystem& files, std::filesystem::path path, std::shared_ptr<platform::Queue> queue);

    /// Records new events, which are at `fate` or were dropped because of it.
    void record(FeedbackFate fate, std::uint64_t events = 1);
    /// Moves events from one place to another.
    void move(FeedbackFate from, FeedbackFate to, std::uint64_t events);
    /// Books found events of an earlier process: moves them from `Unknown` to `fate`, and records those in excess.
    void find(FeedbackFate fate, std::uint64_t events);
    /// Moves the events of an upload from `Uploading` to `outcome`, and saves the books before it returns. `upload`
    /// identifies the upload among those of all processes.
    void settle(const std::string& upload, FeedbackFate outcome, std::uint64_t events);
    /// Returns whether an upload was settled recently. If a kill keeps the upload session from forgetting an upload, it
    /// reports the outcome again; such an outcome must not be booked twice.
    [[nodiscard]] bool isSettled(const std::string& upload) const;
    /// Writes the books to disk. A failure is logged; the books in memory stay valid.
    void save();
    /// Saves asynchronously. Several calls before the save cause only one.
    void saveSoon();

    /// Returns an identifier of this process, unique among all that use these books.
    [[nodiscard]] const std::string& process() const { return _process; }

    [[nodiscard]] std::int64_t recorded() const;
    [[nodiscard]] std::int64_t count(FeedbackFate fate) const;
    /// Returns {"recorded", "open", "closed", "uploading", "sent", "notSent", "unknown", "dropped": {reason: events}}
    /// with every reason.
    [[nodiscard]] platform::Value description() const;

private:
    void _load() REQUIRES(_mutex);

    platform::FileSystem& _files;
    const std::filesystem::path _path;
    const std::string _process;
    mutable platform::Mutex _mutex;
    std::int64_t _recorded GUARDED_BY(_mutex) = 0;
    std::array<std::int64_t, kFeedbackFates> _counts GUARDED_BY(_mutex){};
    std::int64_t _unresolved GUARDED_BY(_mutex) = 0;     ///< unknown events that may still be found
    std::deque<std::string> _settled GUARDED_BY(_mutex); ///< uploads whose outcome is booked, the newest last
    bool _saveQueued GUARDED_BY(_mutex) = false;
    bool _unread GUARDED_BY(_mutex) = false; ///< the file's counts are still to be added
    std::shared_ptr<platform::Queue> _queue;
    platform::Mutex _saving; // orders the writes: an older state never overwrites a newer one
};

} // namespace tavrin
