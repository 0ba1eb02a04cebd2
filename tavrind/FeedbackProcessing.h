#pragma once

#include <memory>

namespace tavrin {

class SessionProcessingHelper;
struct ZRFeedback;

/// A record as it may leave the device: the identifiers of the results and suggestions that it holds are replaced by
/// `helper`'s, which learns whether the record shows them whole or only refers to them.
///
/// `record` and all that it holds stay as they are. What changes is copied; a record without results and suggestions is
/// answered itself. Null stays null.
[[nodiscard]] std::shared_ptr<ZRFeedback> processedFeedback(const std::shared_ptr<ZRFeedback>& record,
                                                            SessionProcessingHelper& helper);

} // namespace tavrin
