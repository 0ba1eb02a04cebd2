#include "tavrind/TavrinSessionFeedback.h"

#include <array>

namespace tavrin {

namespace {

constexpr std::array<std::string_view, 7> kReasons{"no previous session",     "external request", "session idle",
                                                   "max session time passed", "guid changed",     "critical memory",
                                                   "engagement received"};

} // namespace

std::span<const std::string_view> TavrinSessionEndFeedback::eventTypes()
{
    return kReasons;
}

std::string_view TavrinSessionEndFeedback::triggerEventEnumToString(SessionEndReason reason)
{
    const auto index = static_cast<std::uint64_t>(reason);
    return kReasons[index < kReasons.size() ? index : 0];
}

} // namespace tavrin
