#include "tavrind/TavrinLogging.h"

#include <array>
#include <cstdlib>

namespace tavrin {

const platform::Log& TavrinLogForCategory(unsigned category)
{
    static constexpr const char* kSubsystem = "com.quorvane.tavrind";
    static const std::array<platform::Log, TavrinLoggingCategoryCount> handles{{
        {kSubsystem, "Tavrin"},
        {kSubsystem, "Tavrin_Feedback"},
        {kSubsystem, "Tavrin_Session"},
        {kSubsystem, "Tavrin_Request"},
        {kSubsystem, "Tavrin_Flusher"},
        {kSubsystem, "Tavrin_Search"},
        {kSubsystem, "Tavrin_ZeroKeyword"},
        {kSubsystem, "Tavrin_MoreResults"},
        {kSubsystem, "Tavrin_Card"},
        {kSubsystem, "Tavrin_LookUp"},
        {kSubsystem, "Tavrin_Flight"},
        {kSubsystem, "Tavrin_Images"},
        {kSubsystem, "Tavrin_Connection"},
        {kSubsystem, "Tavrin_DownloadManager"},
        {kSubsystem, "Tavrin_Bag"},
        {kSubsystem, "Tavrin_Subscription"},
        {kSubsystem, "Tavrin_Caching"},
        {kSubsystem, "Tavrin_Feedback_Errors"},
        {kSubsystem, "Tavrin_Feedback_Storage"},
    }};
    if (category >= handles.size()) {
        platform::defaultLog().fault("category < TavrinLoggingCategoryCount");
        std::abort();
    }
    return handles[category];
}

} // namespace tavrin
