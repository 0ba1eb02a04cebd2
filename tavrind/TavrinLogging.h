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

/// The handle of a category, all made on first use. An index out of range is a programming error and aborts. Any
/// thread.
[[nodiscard]] const platform::Log& TavrinLogForCategory(unsigned category);

} // namespace tavrin
