#include "tavrind/TavrinFeedback.h"

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/FeedbackProcessing.h"
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

platform::Dictionary TavrinFeedback::_commonDictionary() const
{
    static const ZRFeedback kNothing;
    const ZRFeedback& record = feedback ? *feedback : kNothing;
    const EventType type = eventType(record);
    platform::Dictionary event = feedbackDictionary(record, type);
    if (requiresQueryId(type)) {
        event.set("query_id", queryId);
        if (clientQueryId != 0) event.set("client_query_id", clientQueryId);
    }
    event.set("type", eventTypeToString(type));
    return event;
}

platform::Dictionary TavrinFeedback::dictionary() const
{
    platform::Dictionary event = _commonDictionary();
    event.set("timestamp", relTimestamp);
    return event;
}

std::string TavrinFeedback::description() const
{
    platform::Dictionary event = _commonDictionary();
    event.set("timestamp", mach_duration_to_milliseconds(timestamp()));
    return platform::toJson(std::move(event));
}

void TavrinFeedback::process(SessionProcessingHelper& helper)
{
    if (feedback) tavrin::process(*feedback, helper);
}

bool TavrinFeedback::decodeField(std::string_view key, platform::Decoder& decoder, std::size_t& next)
{
    if (key != "feedback") return RecordOf::decodeField(key, decoder, next);
    feedback = platform::decodeRecordIfA<ZRFeedback>(decoder);
    return true;
}

std::uint64_t mach_duration_to_milliseconds(std::uint64_t duration, HostTimebase timebase)
{
    if (timebase.denominator == 0) return 0;
    const std::uint64_t nanoseconds = duration * timebase.numerator / timebase.denominator;
    return static_cast<std::uint64_t>(static_cast<double>(nanoseconds) / 1'000'000);
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
