#include "tavrind/TavrinFeedback.h"

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/FeedbackClasses.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

TavrinFeedback::TavrinFeedback() : TavrinFeedback(nullptr, 0, {}, {}) {}

TavrinFeedback::TavrinFeedback(std::shared_ptr<ZRFeedback> feedback_, std::int64_t queryId_, std::string userGuid_,
                               std::string userAgent_, std::uint64_t clientQueryId_)
    : queryId(queryId_), userGuid(std::move(userGuid_)), userAgent(std::move(userAgent_)), clientQueryId(clientQueryId_)
{
    _setFeedback(std::move(feedback_));
}

const ZRFeedback& TavrinFeedback::_record() const
{
    static const ZRFeedback kNothing;
    return _feedback ? *_feedback : kNothing;
}

void TavrinFeedback::_setFeedback(std::shared_ptr<ZRFeedback> feedback)
{
    _feedback = std::move(feedback);
    _class = &feedbackClassOf(_record());
}

EventType TavrinFeedback::type() const
{
    return _class->eventType(_record());
}

platform::Dictionary TavrinFeedback::_commonDictionary() const
{
    platform::Dictionary event;
    event.reserve(8); // most records add up to four fields, and an event four more
    JsonFields fields(event);
    _class->addFields(fields, _record());
    const EventType eventType = type();
    if (requiresQueryId(eventType)) {
        fields("query_id", queryId);
        if (clientQueryId != 0) fields("client_query_id", clientQueryId);
    }
    fields("type", eventTypeToString(eventType));
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
    if (_feedback) _class->process(*_feedback, helper);
}

bool TavrinFeedback::decodeField(std::string_view key, platform::Decoder& decoder, std::size_t& next)
{
    if (key != "feedback") return RecordOf::decodeField(key, decoder, next);
    _setFeedback(platform::decodeRecordIfA<ZRFeedback>(decoder));
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
