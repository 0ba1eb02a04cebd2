#pragma once

namespace tavrin {

class SessionProcessingHelper;
struct ZRFeedback;

/// Makes a record fit to leave the device: the identifiers of the results and suggestions that it holds are replaced,
/// in the record itself, by `helper`'s, which learns whether the record shows them whole or only refers to them.
///
/// Once for a record: the second time its replacements would be replaced. What a session file holds is read anew for
/// each pass. A result that `helper` keeps as missing is shared with the record.
void process(ZRFeedback& record, SessionProcessingHelper& helper);

} // namespace tavrin
