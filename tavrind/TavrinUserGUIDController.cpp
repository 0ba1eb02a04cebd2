#include "tavrind/TavrinUserGUIDController.h"

#include "platform/device/Device.h"
#include "platform/run/Clock.h"
#include "platform/run/NotificationCenter.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"

namespace tavrin {
namespace {
constexpr std::chrono::seconds kLifetime{900};
}

TavrinUserGUIDController::TavrinUserGUIDController(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrin.guid", rank::kGuid)),
      _lastKnownUserGUID(platform::Uuid::random()),
      _lastKnownUserGUIDExpirationDate(assembly.device.clock.wallNow() + kLifetime)
{}

platform::Uuid TavrinUserGUIDController::currentUserGUID()
{
    return _queue->sync([this] {
        const platform::Duration left = _lastKnownUserGUIDExpirationDate - _assembly.device.clock.wallNow();
        if (left <= platform::Duration::zero() || left > kLifetime) _rollGUID(); // longer: the clock was set back
        return _lastKnownUserGUID;
    });
}

platform::Uuid TavrinUserGUIDController::lastKnownUserGUID()
{
    return _queue->sync([this] { return _lastKnownUserGUID; });
}

void TavrinUserGUIDController::reset()
{
    _queue->async([self = shared_from_this()] { self->_rollGUID(); });
}

void TavrinUserGUIDController::_rollGUID()
{
    _queue->assertOnQueue();
    _lastKnownUserGUID = platform::Uuid::random();
    _lastKnownUserGUIDExpirationDate = _assembly.device.clock.wallNow() + kLifetime;
    _queue->async([weak = weak_from_this()] {
        auto self = weak.lock();
        if (!self) return;
        self->_assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.userguid");
        self->_assembly.notificationCenter.post({.name = TAVUserGUIDChangeNotification});
    });
}

} // namespace tavrin
