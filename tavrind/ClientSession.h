#pragma once

#include <memory>

#include "platform/Value.h"

namespace platform {
struct Error;
}

namespace tavrin {

struct Assembly;
struct TavrinFeedback;

/// One session of one user agent: what the user saw and did, until it is complete. It keeps nothing. Any thread.
class ClientSession {
public:
    /// A session that begins with `feedback`.
    ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback);

    void addFeedback(std::shared_ptr<TavrinFeedback> feedback);
    /// Ends the session.
    void sessionComplete();
    /// Dictionaries as they are uploaded, with times relative to the first.
    [[nodiscard]] platform::Value::Array feedbacksWithRelativeTimestamp() const { return {}; }

    /// A session whose only record is an error of the daemon's; the caller completes it.
    [[nodiscard]] static std::shared_ptr<ClientSession> createFeedbackSessionFromError(const platform::Error& error,
                                                                                       Assembly& assembly);

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
