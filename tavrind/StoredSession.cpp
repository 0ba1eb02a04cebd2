#include "tavrind/StoredSession.h"

#include <algorithm>
#include <ranges>
#include <utility>

#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/JsonSink.h"
#include "tavrind/FeedbackJson.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/OutputStream.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;
using platform::operator""_field;

namespace {

/// Passes JSON text on to a stream, piece by piece, so that a long session is never in memory as one text.
class JsonStream {
public:
    explicit JsonStream(OutputStream& stream) : _stream(stream) {}

    platform::JsonTextSink json;

    /// Writes the text if there is enough of it.
    void flush()
    {
        constexpr std::size_t kPiece = 64u << 10;
        if (json.text().size() >= kPiece) write();
    }
    /// Writes the text. Returns false if the stream has failed.
    bool write()
    {
        _good = _good && _stream.write(json.text()) >= 0;
        json.text().clear();
        return _good;
    }

private:
    OutputStream& _stream;
    bool _good = true;
};

} // namespace

const platform::RecordClasses& sessionFileClasses()
{
    static const auto classes = [] {
        platform::RecordClasses all = tavrindRecordClasses();
        all.add<ClientSessionHeader>();
        return all;
    }();
    return classes;
}

void sortByTimestamp(std::vector<std::shared_ptr<TavrinFeedback>>& feedbacks)
{
    std::ranges::stable_sort(
        feedbacks, [](const auto& a, const auto& b) { return TavrinFeedback::timeStampComparator(*a, *b) < 0; });
}

StoredSession::StoredSession(ClientSessionHeader header, platform::Bytes file)
    : _header(std::move(header)), _file(std::move(file)), _open(sessionFileClasses())
{}

StoredSession::~StoredSession() = default;

platform::Result<bool> StoredSession::add(std::string_view archive)
{
    if (!_open.open(archive)) {
        const auto record = platform::unarchive(archive, sessionFileClasses());
        if (!record) return std::unexpected(record.error());
        archive = _rewritten.emplace_back(platform::archive(**record));
        if (!_open.open(archive)) return false;
    }
    const auto event = _open.root().as<TavrinFeedback>();
    if (!event) return false;
    _events.push_back({.timestamp = event["feedback"_field]["timestamp"_field], .archive = archive});
    ++_recordedEvents;
    return true;
}

std::vector<std::shared_ptr<TavrinFeedback>> StoredSession::feedbacks() const
{
    std::vector<std::shared_ptr<TavrinFeedback>> feedbacks;
    feedbacks.reserve(_events.size());
    for (const Event& event : _events)
        feedbacks.push_back(
            *platform::castRecord<TavrinFeedback>(platform::unarchive(event.archive, sessionFileClasses())));
    return feedbacks;
}

std::string StoredSession::_userGuid() const
{
    return _header.userGuid.isNil() ? "" : _header.userGuid.string();
}

std::string StoredSession::description() const
{
    return platform::toJson(_rest());
}

Dictionary StoredSession::_rest() const
{
    Dictionary rest{{"agent", _header.agent}, {"user_guid", _userGuid()}};
    if (!_header.resourceVersions.asDictionary()) return rest;
    rest.set("resource_versions", _header.resourceVersions);
    rest.set("first_use", _header.firstUse);
    const bool hidden = _header.removeTimestamps || !_header.baseTime;
    rest.set("base_time", hidden ? 0 : static_cast<std::int64_t>(platform::secondsSince1970(*_header.baseTime)));
    const auto reason = TavrinSessionEndFeedback::triggerEventEnumToString(
        static_cast<SessionEndReason>(_header.previousSessionEndReason));
    if (reason) rest.set("previous_session_end_reason", *reason);
    return rest;
}

std::optional<std::size_t> StoredSession::getFeedbacksToSend(OutputStream& stream)
{
    std::vector<Event> events = std::exchange(_events, {});
    std::ranges::stable_sort(events, {}, &Event::timestamp);
    const std::uint64_t base = events.empty() ? 0 : events.front().timestamp;
    std::uint64_t timestamp = 0;

    JsonStream out(stream);
    out.json.beginObject();
    out.json.key("fb");
    out.json.beginArray();
    SessionProcessingHelper helper;
    for (const Event& next : events) {
        if (!_open.open(next.archive)) continue; // `add` has opened it
        const auto event = _open.root().as<TavrinFeedback>();
        timestamp = mach_duration_to_milliseconds(next.timestamp - base);
        TavrinFeedback::process(event, helper);
        TavrinFeedback::write(out.json, event, timestamp, &helper);
        out.flush();
    }
    // The events of TavrinSessionMissingResults and TavrinSessionMissingSuggestions.
    const auto last = [&]<class R>(std::type_identity<R>, EventType type, const char* key, const auto& missing) {
        if (missing.empty()) return;
        const EventContext context{.type = type, .timestamp = timestamp};
        JsonFields fields(out.json, context, &helper);
        out.json.beginObject();
        fields.records<R>(key, std::views::values(missing), _open);
        fields.finish();
        out.json.endObject();
    };
    last(std::type_identity<ZRSearchResult>(), EventType::SessionMissingResults, "results", helper.missingResults());
    last(std::type_identity<ZRSearchSuggestion>(), EventType::SessionMissingSuggestions, "suggestions",
         helper.missingSuggestions());
    out.json.endArray();

    const Dictionary rest = _rest();
    for (const auto& [key, value] : rest) {
        out.json.key(key);
        out.json.value(value);
    }
    out.json.endObject();
    _rewritten.clear();
    _file = {};
    return out.write() ? std::optional(1 + rest.size()) : std::nullopt;
}

} // namespace tavrin
