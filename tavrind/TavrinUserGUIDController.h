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

/// The GUID that identifies a user for a short while: replaced by a random one after 15 minutes, or on request.
///
/// Rotation is lazy, nothing fires at the 15-minute mark: the first reading after it rolls. The GUID is never stored,
/// so every start begins with a new one. Any thread.
class TavrinUserGUIDController : public std::enable_shared_from_this<TavrinUserGUIDController> {
public:
    explicit TavrinUserGUIDController(Assembly& assembly);

    /// The GUID, rolled first if its time is up.
    [[nodiscard]] platform::Uuid currentUserGUID();
    /// Rolls soon.
    void reset();

private:
    void _rollGUID();

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queue;
    platform::Uuid _lastKnownUserGUID;
    platform::Date _lastKnownUserGUIDExpirationDate;
};

} // namespace tavrin
