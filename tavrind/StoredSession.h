#pragma once

#include <memory>
#include <vector>

#include "tavrind/ClientSessionHeader.h"
#include "tavrind/Flushable.h"

namespace platform {
class Dictionary;
}

namespace tavrin {

struct TavrinFeedback;

/// Sorts events oldest first; those with equal timestamps keep their order.
void sortByTimestamp(std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks);

/// A session read back from its file, ready for upload. One thread at a time.
class StoredSession final : public Flushable {
public:
    StoredSession(ClientSessionHeader header, std::vector<std::shared_ptr<TavrinFeedback>> feedbacks);
    ~StoredSession() override;

    /// Writes the session object of docs/feedback.md: its events oldest first, with milliseconds since the first and
    /// with replaced identifiers, then the results and suggestions that they refer to but never show. The keys end at
    /// the first missing value. Releases each event after writing it.
    [[nodiscard]] std::optional<std::size_t> getFeedbacksToSend(OutputStream& stream) override;
    [[nodiscard]] std::size_t recordedEvents() const override { return _recordedEvents; }
    [[nodiscard]] std::string description() const override;

    [[nodiscard]] const ClientSessionHeader& header() const { return _header; }
    /// Returns the events in the order of the file; empty after `getFeedbacksToSend`.
    [[nodiscard]] const std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks() const { return _feedbacks; }

private:
    /// Returns the object without "fb".
    [[nodiscard]] platform::Dictionary _rest() const;
    [[nodiscard]] std::string _userGuid() const;

    ClientSessionHeader _header;
    std::vector<std::shared_ptr<TavrinFeedback>> _feedbacks;
    std::size_t _recordedEvents;
};

} // namespace tavrin
