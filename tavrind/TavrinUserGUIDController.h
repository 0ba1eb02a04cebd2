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
/// Rotation is lazy: no timer fires after 15 minutes, but the next reading rolls the GUID. It is never stored, so every
/// start begins with a new one. Every roll is counted and posted as TAVUserGUIDChangeNotification, later and on the
/// controller's queue. Any thread.
class TavrinUserGUIDController : public std::enable_shared_from_this<TavrinUserGUIDController> {
public:
    explicit TavrinUserGUIDController(Assembly& assembly);

    /// Returns the GUID, and rolls it first if it has expired.
    [[nodiscard]] platform::Uuid currentUserGUID();
    /// Rolls the GUID before the next reading.
    void reset();

private:
    void _rollGUID();

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queue;
    platform::Uuid _lastKnownUserGUID;
    platform::Date _lastKnownUserGUIDExpirationDate;
};

} // namespace tavrin
