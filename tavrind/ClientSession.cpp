#include "tavrind/ClientSession.h"

#include <algorithm>
#include <array>

#include "CoreTavrin/TAVError.h"
#include "platform/Calendar.h"
#include "platform/Clock.h"
#include "platform/Device.h"
#include "platform/LocaleSource.h"
#include "platform/Text.h"
#include "platform/UserDefaults.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/FileContainer.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinPersistentStorage.h"
#include "tavrind/TavrinSessionFeedback.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

using Feedbacks = std::vector<std::shared_ptr<TavrinFeedback>>;

/// The first of `names` that the text, in small letters, contains.
template <std::size_t N>
std::optional<std::string_view> firstNamed(std::string_view text, const std::array<std::string_view, N>& names)
{
    const std::string lower = platform::lowerCased(text);
    const auto* found = std::ranges::find_if(names, [&](std::string_view name) { return lower.contains(name); });
    return found == names.end() ? std::nullopt : std::optional(*found);
}

/// Milliseconds from the first event to this one; events are in order.
std::uint64_t relativeTimestamp(const TavrinFeedback& feedback, std::uint64_t base)
{
    return mach_duration_to_milliseconds(feedback.timestamp() - base);
}

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
        while (_next < _feedbacks.size()) {
            const auto feedback = std::exchange(_feedbacks[_next++], nullptr);
            _lastTimestamp = relativeTimestamp(*feedback, _base);
            const auto processed = feedback->processed(_helper);
            processed->relTimestamp = _lastTimestamp;
            return processed->dictionary();
        }
        if (_missing == 0 && ++_missing) {
            if (auto results = _helper.missingResults(); !results.empty())
                return lastly(std::make_shared<TavrinSessionMissingResults>(std::move(results)));
        }
        if (_missing == 1 && ++_missing) {
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
    int _missing = 0; // of the two kinds, those that were asked for
    SessionProcessingHelper _helper;
};

} // namespace

std::optional<std::string> firstUseKey(std::string_view userAgent)
{
    static constexpr std::array<std::string_view, 6> kClients{"wendral", "vistrel", "lookup", "messages", "news", "kivo"};
    const auto client = firstNamed(userAgent, kClients);
    return client ? std::optional("TavrinFirstUseOfTheDay_" + std::string(*client)) : std::nullopt;
}

std::optional<std::string_view> dailyActiveClient(std::string_view firstUseKey)
{
    static constexpr std::array<std::string_view, 7> kClients{"wendral", "vistrel",  "kivo",   "lookup",
                                                              "messages", "news", "tavrind"};
    return firstNamed(firstUseKey, kClients);
}

ClientSession::ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                             std::int64_t previousSessionEndReason)
    : _assembly(&assembly), _sessionQueue(assembly.device.serialQueue("com.quorvane.tavrind.clientSessionQueue")),
      _sessionFeedbacks(std::make_shared<Feedbacks>())
{
    if (feedback) {
        _header.agent = feedback->userAgent;
        _header.userGuid = platform::Uuid::parse(feedback->userGuid).value_or(platform::Uuid());
        _header.removeTimestamps = feedback->type() == EventType::CustomVistrelResultFeatures;
    }
    _header.previousSessionEndReason = previousSessionEndReason;
    _header.baseTime = assembly.device.clock.wallNow();
    assembly.diagnosticData.addValue(1, createCounterKey(_header.agent, "sessions"));
    _header.firstUse = _firstUseOfTheDay();
    if (assembly.downloadManager) _header.resourceVersions = assembly.downloadManager->resourceVersions();
    if (assembly.persistentStorage) _storageHandle = assembly.persistentStorage->createFileContainerForWriting();
    if (_storageHandle) _storageHandle->writeSessionHeader(_header);
    if (feedback) addFeedback(std::move(feedback));
}

ClientSession::ClientSession(ClientSessionHeader header, Feedbacks feedbacks)
    : _header(std::move(header)), _recordedEvents(feedbacks.size()),
      _sessionFeedbacks(std::make_shared<Feedbacks>(std::move(feedbacks)))
{}

ClientSession::~ClientSession() = default;

bool ClientSession::_firstUseOfTheDay()
{
    const auto key = firstUseKey(_header.agent);
    const auto firstUseDate = key ? _assembly->userDefaults.date(*key) : std::nullopt;
    const std::string zone = _assembly->device.locale.timeZone();
    if (firstUseDate && platform::localDay(*firstUseDate, zone) == platform::localDay(*_header.baseTime, zone))
        return false;
    return _updateFirstUseDate();
}

bool ClientSession::_updateFirstUseDate()
{
    const auto key = firstUseKey(_header.agent);
    if (!key) {
        TavrinLogForCategory(kLogSession).info("user default key not found for agent: {}", _header.agent);
        return false;
    }
    _assembly->userDefaults.set(*key, *_header.baseTime);
    _assembly->userDefaults.synchronize();
    if (const auto client = dailyActiveClient(*key))
        _assembly->diagnosticData.addValue(1, createCounterKey(*client, "dailyactiveusers"));
    return true;
}

void ClientSession::addFeedback(std::shared_ptr<TavrinFeedback> feedback)
{
    if (!feedback || !_assembly) return TavrinLogForCategory(kLogSession).error("attempted to add a nil feedback");
    const bool otherUser = !_header.userGuid.isNil() && feedback->userGuid != _header.userGuid.string();
    const std::string agent = feedback->userAgent;
    _write(std::move(feedback));
    if (!otherUser) return;
    auto error = std::make_shared<ZRErrorFeedback>(makeTAVError(TAVErrorInvalidResponse, "different guid in session"));
    error->timestamp = _assembly->device.clock.hostTicks();
    _write(std::make_shared<TavrinFeedback>(std::move(error), 0, "", agent));
}

void ClientSession::_write(std::shared_ptr<TavrinFeedback> feedback)
{
    if (_assembly->flusherXPCListener) _assembly->flusherXPCListener->sendDataToReceivingStreamListener(*feedback);
    _assembly->feedbackBooks.record(_storageHandle ? FeedbackFate::Open : FeedbackFate::NoContainer);
    if (!_storageHandle) return;
    std::move_only_function<void()> keep;
    if (_assembly->testFeedbacks)
        keep = [queue = _sessionQueue, kept = _sessionFeedbacks, feedback] {
            queue->async([kept, feedback] { kept->push_back(feedback); });
        };
    _storageHandle->writeFeedback(std::move(feedback), std::move(keep));
}

void ClientSession::sessionComplete()
{
    _sessionQueue->sync([this] {
        if (!_storageHandle) return TavrinLogForCategory(kLogSession).fault("Storage Handle nil major error");
        _assembly->persistentStorage->closeSessionWithFileContainer(_storageHandle);
    });
}

Feedbacks ClientSession::getSessionFeedbacks()
{
    Feedbacks feedbacks = _sessionQueue ? _sessionQueue->sync([this] { return *_sessionFeedbacks; }) : *_sessionFeedbacks;
    std::ranges::stable_sort(feedbacks, [](const auto& a, const auto& b) {
        return TavrinFeedback::timeStampComparator(*a, *b) < 0;
    });
    return feedbacks;
}

Value::Array ClientSession::feedbacksWithRelativeTimestamp()
{
    const Feedbacks feedbacks = getSessionFeedbacks();
    Value::Array events;
    for (const auto& feedback : feedbacks) {
        feedback->relTimestamp = relativeTimestamp(*feedback, feedbacks.front()->timestamp());
        events.emplace_back(feedback->dictionary());
    }
    return events;
}

Value::Array ClientSession::privacyFilteredFeedbacksWithRelativeTimestamp()
{
    UploadedEvents uploaded(getSessionFeedbacks(), _header);
    Value::Array events;
    while (auto event = uploaded.next()) events.emplace_back(std::move(*event));
    return events;
}

FeedbacksToSend ClientSession::getFeedbacksToSend()
{
    auto events = std::make_unique<UploadedEvents>(getSessionFeedbacks(), _header);
    if (!_sessionQueue) _sessionFeedbacks->clear();
    FeedbacksToSend upload{.nextEvent = [events = std::move(events)] { return events->next(); }};

    Dictionary rest{{"agent", _header.agent},
                    {"user_guid", _header.userGuid.isNil() ? "" : _header.userGuid.string()}};
    // The list ends at what is missing.
    if (_header.resourceVersions.asDictionary()) {
        rest.set("resource_versions", _header.resourceVersions);
        rest.set("first_use", _header.firstUse);
        const bool hidden = _header.removeTimestamps || !_header.baseTime;
        rest.set("base_time",
                 hidden ? 0 : static_cast<std::int64_t>(platform::secondsSince1970(*_header.baseTime)));
        rest.set("previous_session_end_reason",
                 TavrinSessionEndFeedback::triggerEventEnumToString(
                     static_cast<SessionEndReason>(_header.previousSessionEndReason)));
    }
    upload.rest = std::move(rest);
    return upload;
}

std::shared_ptr<ClientSession> ClientSession::createFeedbackSessionFromError(const platform::Error& error,
                                                                             Assembly& assembly)
{
    return std::make_shared<ClientSession>(assembly, ClientSessionManager::errorFeedback(error, assembly));
}

} // namespace tavrin
