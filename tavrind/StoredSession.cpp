#include "tavrind/StoredSession.h"

#include <algorithm>
#include <utility>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/OutputStream.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

using Feedbacks = std::vector<std::shared_ptr<TavrinFeedback>>;

/// Writes a session object piece by piece, so that a long session is never in memory as one text.
class SessionWriter {
public:
    explicit SessionWriter(OutputStream& stream) : _stream(stream) { _write(R"({"fb":[)"); }

    void event(Dictionary event)
    {
        if (std::exchange(_hasEvents, true)) _write(",");
        _write(platform::toJson(std::move(event)));
    }
    /// Returns false if the stream has failed.
    bool finish(const Dictionary& rest)
    {
        _write("]");
        for (const auto& [key, value] : rest) {
            _write(",");
            _write(platform::toJson(key));
            _write(":");
            _write(platform::toJson(value));
        }
        _write("}");
        return _good;
    }

private:
    void _write(std::string_view text) { _good = _good && _stream.write(text) >= 0; }

    OutputStream& _stream;
    bool _good = true;
    bool _hasEvents = false;
};

} // namespace

void sortByTimestamp(Feedbacks& feedbacks)
{
    std::ranges::stable_sort(
        feedbacks, [](const auto& a, const auto& b) { return TavrinFeedback::timeStampComparator(*a, *b) < 0; });
}

StoredSession::StoredSession(ClientSessionHeader header, Feedbacks feedbacks)
    : _header(std::move(header)), _feedbacks(std::move(feedbacks)), _recordedEvents(_feedbacks.size())
{}

StoredSession::~StoredSession() = default;

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
    const Value& reason = TavrinSessionEndFeedback::triggerEventEnumToString(
        static_cast<SessionEndReason>(_header.previousSessionEndReason));
    if (!reason.isNull()) rest.set("previous_session_end_reason", reason);
    return rest;
}

std::optional<std::size_t> StoredSession::getFeedbacksToSend(OutputStream& stream)
{
    Feedbacks feedbacks = std::exchange(_feedbacks, {});
    sortByTimestamp(feedbacks);
    const std::uint64_t base = feedbacks.empty() ? 0 : feedbacks.front()->timestamp();
    std::uint64_t timestamp = 0;

    SessionWriter writer(stream);
    SessionProcessingHelper helper;
    for (auto& next : feedbacks) {
        const auto feedback = std::exchange(next, nullptr);
        timestamp = mach_duration_to_milliseconds(feedback->timestamp() - base);
        feedback->relTimestamp = timestamp;
        feedback->process(helper);
        writer.event(feedback->dictionary());
    }
    const auto last = [&](std::shared_ptr<ZRFeedback> record) {
        TavrinFeedback feedback(std::move(record), 0, _userGuid(), _header.agent);
        feedback.relTimestamp = timestamp;
        writer.event(feedback.dictionary());
    };
    if (auto results = helper.missingResults(); !results.empty())
        last(std::make_shared<TavrinSessionMissingResults>(std::move(results)));
    if (auto suggestions = helper.missingSuggestions(); !suggestions.empty())
        last(std::make_shared<TavrinSessionMissingSuggestions>(std::move(suggestions)));

    const Dictionary rest = _rest();
    return writer.finish(rest) ? std::optional(1 + rest.size()) : std::nullopt;
}

} // namespace tavrin
