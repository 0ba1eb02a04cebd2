#pragma once

#include <cstddef>
#include <optional>
#include <string>

namespace tavrin {

class OutputStream;

/// A source of feedback that is uploaded as one JSON object. One thread at a time.
class Flushable {
public:
    virtual ~Flushable() = default;
    /// Writes the object and returns the number of its top-level keys. Returns nothing if the feedback is not a JSON
    /// object or the stream fails. Releases the feedback: call it once.
    [[nodiscard]] virtual std::optional<std::size_t> getFeedbacksToSend(OutputStream& stream) = 0;
    /// Returns the number of recorded events in it.
    [[nodiscard]] virtual std::size_t recordedEvents() const = 0;
    /// Returns a text for log lines.
    [[nodiscard]] virtual std::string description() const = 0;
};

} // namespace tavrin
