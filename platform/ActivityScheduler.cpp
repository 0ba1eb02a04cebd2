#include "platform/ActivityScheduler.h"

namespace platform {

std::unique_ptr<ActivityScheduler> makeActivityScheduler()
{
    return nullptr;
}

} // namespace platform
