#include "tavrind/TavrinFeedback.h"

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/values/Archive.h"
#include "platform/values/JsonSink.h"
#include "tavrind/FeedbackClasses.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

using platform::operator""_field;

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

void TavrinFeedback::process(const Archived& event, SessionProcessingHelper& helper)
{
    const auto record = event["feedback"_field];
    if (const auto process = feedbackClassOf(record).process) process(record, helper);
}

void TavrinFeedback::write(platform::JsonSink& sink, const Archived& event, std::uint64_t timestamp,
                           const SessionProcessingHelper* identifiers)
{
    const auto record = event["feedback"_field];
    const FeedbackClass& row = feedbackClassOf(record);
    EventContext context{.type = row.archivedEventType(record), .timestamp = timestamp};
    if (requiresQueryId(context.type)) {
        context.queryId = event["query_id"_field];
        if (const std::uint64_t clientQueryId = event["_clientQueryId"_field]; clientQueryId != 0)
            context.clientQueryId = clientQueryId;
    }
    sink.beginObject();
    JsonFields fields(sink, context, row.process ? identifiers : nullptr);
    row.addFields(fields, record);
    fields.finish();
    sink.endObject();
}

void TavrinFeedback::_writeTo(platform::JsonSink& sink, std::uint64_t timestamp) const
{
    const std::string bytes = platform::archive(*this);
    platform::OpenArchive archive(tavrindRecordClasses());
    if (archive.open(bytes))
        write(sink, archive.root().as<TavrinFeedback>(), timestamp);
    else
        sink.null(); // nested too deep
}

platform::Value TavrinFeedback::dictionary() const
{
    platform::JsonValueSink sink;
    _writeTo(sink, relTimestamp);
    return sink.take();
}

std::string TavrinFeedback::description() const
{
    platform::JsonTextSink sink;
    _writeTo(sink, mach_duration_to_milliseconds(timestamp()));
    return std::move(sink.text());
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
