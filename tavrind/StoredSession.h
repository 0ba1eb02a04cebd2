#pragma once

#include <memory>
#include <vector>

#include "tavrind/ClientSessionHeader.h"
#include "tavrind/FeedbacksToSend.h"

namespace tavrin {

struct TavrinFeedback;

/// Sorts events oldest first; those of one moment keep their order.
void sortByTimestamp(std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks);

/// A session as its file has it, on its way to the service. One thread at a time.
class StoredSession final : public Flushable {
public:
    StoredSession(ClientSessionHeader header, std::vector<std::shared_ptr<TavrinFeedback>> feedbacks);
    ~StoredSession() override;

    /// The upload: events in order, with milliseconds since the first and with identifiers replaced; behind them what
    /// they refer to and none showed. Entries behind the first one that is missing are left out. Gives the events away.
    [[nodiscard]] FeedbacksToSend getFeedbacksToSend() override;
    [[nodiscard]] std::size_t recordedEvents() const override { return _recordedEvents; }

    [[nodiscard]] const ClientSessionHeader& header() const { return _header; }
    /// As the file has them, until they are given away.
    [[nodiscard]] const std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks() const { return _feedbacks; }

private:
    ClientSessionHeader _header;
    std::vector<std::shared_ptr<TavrinFeedback>> _feedbacks;
    std::size_t _recordedEvents;
};

} // namespace tavrin
