#pragma once

#include <cstddef>
#include <functional>
#include <optional>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace tavrin {

/// One JSON object that is to be sent. The events of a session, its first entry "fb", are made one by one as they are
/// written, so that a long session is never in memory as a whole. For one reader, once.
struct FeedbacksToSend {
    /// The next event of "fb"; none at the end. Empty for an object without "fb".
    std::move_only_function<std::optional<platform::Dictionary>()> nextEvent{};
    /// The entries behind "fb". Anything but a dictionary is not sent.
    platform::Value rest{};

    /// Top-level keys of the object.
    [[nodiscard]] std::size_t count() const { return rest.count() + (nextEvent ? 1 : 0); }
};

/// Something that has feedback to send.
class Flushable {
public:
    virtual ~Flushable() = default;
    /// Gives the feedback away: a second call may find none.
    [[nodiscard]] virtual FeedbacksToSend getFeedbacksToSend() = 0;
    /// Recorded events in it, for the books.
    [[nodiscard]] virtual std::size_t recordedEvents() const = 0;
};

} // namespace tavrin
