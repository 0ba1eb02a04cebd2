#include "tavrind/TavrinXPCActivity.h"

#include "platform/Device.h"
#include "tavrind/Assembly.h"
#include "tavrind/TavrinLogging.h"

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
    const platform::ActivityState current = activity.state();
    if (activity.setState(state)) return true;
    TavrinLogForCategory(kLogFlusher)
        .fault("State transition from {} to {} invalid", static_cast<int>(current), static_cast<int>(state));
    return false;
}

} // namespace tavrin
