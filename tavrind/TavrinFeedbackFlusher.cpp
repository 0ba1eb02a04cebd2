#include "tavrind/TavrinFeedbackFlusher.h"

namespace tavrin {

std::string_view convertIdentifierToString(std::uint64_t identifier)
{
    switch (identifier) {
    case 0: return "crowdsourcing";
    case 1: return "Feedbacks";
    default: return "";
    }
}

void TavrinFeedbackFlusher::flush(std::shared_ptr<ZRFeedback>, std::move_only_function<void()> callback)
{
    if (callback) callback();
}

} // namespace tavrin
