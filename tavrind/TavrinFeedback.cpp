#include "tavrind/TavrinFeedback.h"

#include "CoreTavrin/TAVRecordClasses.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

TavrinFeedback::TavrinFeedback(std::shared_ptr<ZRFeedback> feedback_, std::int64_t queryId_, std::string userGuid_,
                               std::string userAgent_, std::uint64_t clientQueryId_)
    : feedback(std::move(feedback_)), queryId(queryId_), userGuid(std::move(userGuid_)),
      userAgent(std::move(userAgent_)), clientQueryId(clientQueryId_)
{}

EventType TavrinFeedback::type() const
{
    return feedback ? eventType(*feedback) : EventType::Unknown;
}

const platform::RecordClasses& tavrindRecordClasses()
{
    static const auto classes = [] {
        platform::RecordClasses all = coreRecordClasses();
        all.addAll(platform::RecordClasses::of<TavrinFeedback, TavrinSessionEndFeedback, TavrinSessionMissingResults,
                                               TavrinSessionMissingSuggestions, TavrinConnectionInvalidated>());
        return all;
    }();
    return classes;
}

} // namespace tavrin
