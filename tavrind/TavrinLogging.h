#pragma once

#include "platform/base/Log.h"

namespace tavrin {

/// The daemon's log categories, by index.
enum TavrinLogCategory : unsigned {
    kLogGeneral,
    kLogFeedback,
    kLogSession,
    kLogRequest,
    kLogFlusher,
    kLogSearch,
    kLogZeroKeyword,
    kLogMoreResults,
    kLogCard,
    kLogLookUp,
    kLogFlight,
    kLogImages,
    kLogConnection,
    kLogDownloadManager,
    kLogBag,
    kLogSubscription,
    kLogCaching,
    kLogFeedbackErrors,
    kLogFeedbackStorage,
    TavrinLoggingCategoryCount
};

/// Returns the handle of a category; the first call creates all of them. An index out of range is a programming error
/// and aborts the process. Any thread.
[[nodiscard]] const platform::Log& TavrinLogForCategory(unsigned category);
/// The same, in short.
[[nodiscard]] inline const platform::Log& log(TavrinLogCategory category)
{
    return TavrinLogForCategory(category);
}

} // namespace tavrin
