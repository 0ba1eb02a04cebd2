#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace tavrin {

class OutputStream;

/// Something that has feedback to send, as one JSON object. One thread at a time.
class Flushable {
public:
    virtual ~Flushable() = default;
    /// Writes the object and returns the number of its top-level keys; nothing if it is no JSON object or the stream
    /// fails. Gives the feedback away: call it once.
    [[nodiscard]] virtual std::optional<std::size_t> getFeedbacksToSend(OutputStream& stream) = 0;
    /// The number of recorded events in it.
    [[nodiscard]] virtual std::size_t recordedEvents() const = 0;
    /// For log lines.
    [[nodiscard]] virtual std::string description() const = 0;
};

} // namespace tavrin
