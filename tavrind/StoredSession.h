#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Bytes.h"
#include "platform/values/ArchivedRecord.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/Flushable.h"

namespace platform {
class Dictionary;
}

namespace tavrin {

struct TavrinFeedback;

/// Returns the classes of records in a session file. Any thread.
[[nodiscard]] const platform::RecordClasses& sessionFileClasses();

/// Sorts events oldest first; those with equal timestamps keep their order.
void sortByTimestamp(std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks);

/// A session read back from its file, ready for upload. Its events stay in the file's bytes. One thread at a time.
class StoredSession final : public Flushable {
public:
    StoredSession(ClientSessionHeader header, platform::Bytes file);
    ~StoredSession() override;

    /// Adds the event in an archive, which is a part of the file's bytes. Returns false for the archive of another
    /// record, and an error for one that can't be read.
    [[nodiscard]] platform::Result<bool> add(std::string_view archive);

    /// Writes the session object of docs/feedback.md: its events oldest first, with milliseconds since the first and
    /// with replaced identifiers, then the results and suggestions that they refer to but never show. The keys end at
    /// the first missing value. Releases the events.
    [[nodiscard]] std::optional<std::size_t> getFeedbacksToSend(OutputStream& stream) override;
    [[nodiscard]] std::size_t recordedEvents() const override { return _recordedEvents; }
    [[nodiscard]] std::string description() const override;

    [[nodiscard]] const ClientSessionHeader& header() const { return _header; }
    /// Returns the events in the order of the file; empty after `getFeedbacksToSend`.
    [[nodiscard]] std::vector<std::shared_ptr<TavrinFeedback>> feedbacks() const;

private:
    struct Event {
        std::uint64_t timestamp;
        std::string_view archive;
    };
    /// Returns the object without "fb".
    [[nodiscard]] platform::Dictionary _rest() const;
    [[nodiscard]] std::string _userGuid() const;

    ClientSessionHeader _header;
    platform::Bytes _file;
    std::deque<std::string> _rewritten; ///< archives of events that this version would write otherwise
    platform::OpenArchive _open;
    std::vector<Event> _events; ///< in the order of the file
    std::size_t _recordedEvents = 0;
};

} // namespace tavrin
