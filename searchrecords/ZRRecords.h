#pragma once

#include "searchrecords/ZRCardFeedback.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "searchrecords/ZRResultFeedback.h"
#include "searchrecords/ZRSearchFeedback.h"
#include "searchrecords/ZRSearchResult.h"
#include "searchrecords/ZRViewFeedback.h"

namespace tavrin {

/// Returns the classes of all records of this layer. Any thread.
[[nodiscard]] const platform::RecordClasses& searchRecordClasses();

} // namespace tavrin
