#include "tavrind/StoredSession.h"

#include <algorithm>
#include <utility>

#include "platform/values/Dictionary.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

using Feedbacks = std::vector<std::shared_ptr<TavrinFeedback>>;

/// A session's events as they are uploaded, one by one: in order, with identifiers replaced, and at the end what they
/// refer to and none showed.
class UploadedEvents {
public:
    UploadedEvents(Feedbacks feedbacks, const ClientSessionHeader& header)
        : _feedbacks(std::move(feedbacks)), _userGuid(header.userGuid.isNil() ? "" : header.userGuid.string()),
          _agent(header.agent), _base(_feedbacks.empty() ? 0 : _feedbacks.front()->timestamp())
    {}

    std::optional<Dictionary> next()
    {
        if (_next < _feedbacks.size()) {
            const auto feedback = std::exchange(_feedbacks[_next++], nullptr);
            _lastTimestamp = mach_duration_to_milliseconds(feedback->timestamp() - _base);
            feedback->process(_helper);
            feedback->relTimestamp = _lastTimestamp;
            return feedback->dictionary();
        }
        if (!std::exchange(_resultsAsked, true)) {
            if (auto results = _helper.missingResults(); !results.empty())
                return lastly(std::make_shared<TavrinSessionMissingResults>(std::move(results)));
        }
        if (!std::exchange(_suggestionsAsked, true)) {
            if (auto suggestions = _helper.missingSuggestions(); !suggestions.empty())
                return lastly(std::make_shared<TavrinSessionMissingSuggestions>(std::move(suggestions)));
        }
        return std::nullopt;
    }

private:
    [[nodiscard]] Dictionary lastly(std::shared_ptr<ZRFeedback> record) const
    {
        TavrinFeedback feedback(std::move(record), 0, _userGuid, _agent);
        feedback.relTimestamp = _lastTimestamp;
        return feedback.dictionary();
    }

    Feedbacks _feedbacks;
    std::string _userGuid;
    std::string _agent;
    std::uint64_t _base;
    std::uint64_t _lastTimestamp = 0;
    std::size_t _next = 0;
    bool _resultsAsked = false; // for what is missing
    bool _suggestionsAsked = false;
    SessionProcessingHelper _helper;
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

FeedbacksToSend StoredSession::getFeedbacksToSend()
{
    Feedbacks feedbacks = std::exchange(_feedbacks, {});
    sortByTimestamp(feedbacks);
    auto events = std::make_unique<UploadedEvents>(std::move(feedbacks), _header);
    FeedbacksToSend upload{.nextEvent = [events = std::move(events)] { return events->next(); }};

    Dictionary rest{{"agent", _header.agent}, {"user_guid", _header.userGuid.isNil() ? "" : _header.userGuid.string()}};
    // The list ends at the first missing value.
    if (_header.resourceVersions.asDictionary()) {
        rest.set("resource_versions", _header.resourceVersions);
        rest.set("first_use", _header.firstUse);
        const bool hidden = _header.removeTimestamps || !_header.baseTime;
        rest.set("base_time", hidden ? 0 : static_cast<std::int64_t>(platform::secondsSince1970(*_header.baseTime)));
        const Value& reason = TavrinSessionEndFeedback::triggerEventEnumToString(
            static_cast<SessionEndReason>(_header.previousSessionEndReason));
        if (!reason.isNull()) rest.set("previous_session_end_reason", reason);
    }
    upload.rest = std::move(rest);
    return upload;
}

} // namespace tavrin
