#include "platform/BackgroundSession.h"

namespace platform {

std::unique_ptr<BackgroundSessions> makeBackgroundSessions()
{
    return nullptr;
}

} // namespace platform
