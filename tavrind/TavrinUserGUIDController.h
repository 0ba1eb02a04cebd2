#pragma once

#include <memory>

#include "platform/base/Date.h"
#include "platform/base/Uuid.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;

/// Posted after the GUID changed; no object, no user info.
inline constexpr const char* TAVUserGUIDChangeNotification = "TAVUserGUIDChangeNotification";

/// Owns the GUID that identifies a user for a short time: it is replaced by a random one after 15 minutes or on
/// request.
///
/// Replacement is lazy: no timer fires, but the first read after 15 minutes replaces the GUID. It is never stored, so
/// every start begins with a new one. Every replacement is counted and posted as TAVUserGUIDChangeNotification,
/// asynchronously on the controller's queue. Any thread.
class TavrinUserGUIDController : public std::enable_shared_from_this<TavrinUserGUIDController> {
public:
    explicit TavrinUserGUIDController(Assembly& assembly);

    /// Returns the GUID, and replaces it first if it has expired.
    [[nodiscard]] platform::Uuid currentUserGUID();
    /// Returns the GUID even if it has expired. Returns after earlier replacements were posted.
    [[nodiscard]] platform::Uuid lastKnownUserGUID();
    /// Replaces the GUID before the next read.
    void reset();

private:
    void _rollGUID();

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queue;
    platform::Uuid _lastKnownUserGUID;
    platform::Date _lastKnownUserGUIDExpirationDate;
};

} // namespace tavrin
