#include "tavrind/TavrinXPCActivity.h"

#include "platform/device/Device.h"
#include "tavrind/Assembly.h"

namespace tavrin {

void TavrinXPCActivity::registerActivity(Assembly& assembly, const std::string& identifier,
                                         platform::ActivityCriteria criteria, Handler handler)
{
    assembly.device.activities.registerActivity(identifier, criteria, std::move(handler));
}

void TavrinXPCActivity::unregister(Assembly& assembly, const std::string& identifier)
{
    assembly.device.activities.unregister(identifier);
}

bool TavrinXPCActivity::setState(platform::ActivityState state, platform::Activity& activity)
{
    return activity.setState(state);
}

platform::ActivityState TavrinXPCActivity::getStateForActivity(const platform::Activity& activity)
{
    return activity.state();
}

bool TavrinXPCActivity::shouldDefer(const platform::Activity& activity)
{
    return activity.shouldDefer();
}

} // namespace tavrin
