#include "tavrind/ClientSession.h"

#include <algorithm>
#include <array>

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVError.h"
#include "platform/device/Device.h"
#include "platform/device/LocaleSource.h"
#include "platform/files/UserDefaults.h"
#include "platform/run/Clock.h"
#include "platform/text/Calendar.h"
#include "platform/text/Text.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/FileContainer.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinFlusherXPC.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinPersistentStorage.h"

namespace tavrin {

using platform::Value;

namespace {

using Feedbacks = std::vector<std::shared_ptr<TavrinFeedback>>;

} // namespace

std::optional<std::string> firstUseKey(std::string_view userAgent)
{
    static constexpr std::array<std::string_view, 6> kClients{"wendral",  "vistrel", "lookup",
                                                              "messages", "news",    "kivo"};
    const std::string lower = platform::lowerCased(userAgent);
    const auto* client = std::ranges::find_if(kClients, [&](std::string_view name) { return lower.contains(name); });
    if (client == kClients.end()) return std::nullopt;
    return "TavrinFirstUseOfTheDay_" + std::string(*client);
}

ClientSession::ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                             std::int64_t previousSessionEndReason, std::shared_ptr<void> call)
    : ClientSession(assembly, std::move(feedback), previousSessionEndReason, std::move(call), FileUse::Session)
{}

ClientSession::ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
    : ClientSession(assembly, std::move(feedback), 0, std::move(call), FileUse::OneOff)
{}

ClientSession::ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                             std::int64_t previousSessionEndReason, std::shared_ptr<void> call, FileUse use)
    : _assembly(assembly),
      _sessionQueue(assembly.device.serialQueue("com.quorvane.tavrind.clientSessionQueue", rank::kStore)),
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
    _header.firstUse = assembly.dateQueue->sync([this] { return _firstUseOfTheDay(); });
    if (assembly.downloadManager) _header.resourceVersions = assembly.downloadManager->resourceVersions();
    if (assembly.persistentStorage) _storageHandle = assembly.persistentStorage->createFileContainerForWriting(use);
    if (_storageHandle) _storageHandle->writeSessionHeader(_header);
    if (feedback) addFeedback(std::move(feedback), std::move(call));
}

ClientSession::~ClientSession() = default;

bool ClientSession::_firstUseOfTheDay()
{
    const auto key = firstUseKey(_header.agent);
    const auto firstUseDate = key ? _assembly.userDefaults.date(*key) : std::nullopt;
    const std::string zone = _assembly.device.locale.timeZone();
    if (firstUseDate && platform::localDay(*firstUseDate, zone) == platform::localDay(*_header.baseTime, zone))
        return false;
    return _updateFirstUseDate(key);
}

bool ClientSession::_updateFirstUseDate(const std::optional<std::string>& key)
{
    if (!key) {
        log(kLogSession).info("user default key not found for agent: {}", _header.agent);
        return false;
    }
    _assembly.userDefaults.set(*key, *_header.baseTime);
    // Not here: a client waits for its session.
    _assembly.device.globalQueue(platform::Priority::Default)->async([&defaults = _assembly.userDefaults] {
        (void)defaults.synchronize();
    });
    if (const auto client = extractClientNameFromString(*key))
        _assembly.diagnosticData.addValue(1, createCounterKey(*client, "dailyactiveusers"));
    return true;
}

void ClientSession::addFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    if (!feedback) return log(kLogSession).error("attempted to add a nil feedback");
    const bool otherUser = !_header.userGuid.isNil() && feedback->userGuid != _header.userGuid.string();
    const std::string agent = feedback->userAgent;
    _write(std::move(feedback), std::move(call));
    if (!otherUser) return;
    auto error = std::make_shared<ZRErrorFeedback>(makeTAVError(TAVErrorInvalidResponse, "different guid in session"));
    error->timestamp = _assembly.device.clock.hostTicks();
    _write(std::make_shared<TavrinFeedback>(std::move(error), 0, "", agent), nullptr);
}

void ClientSession::_write(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    if (_assembly.flusherXPCListener) _assembly.flusherXPCListener->sendDataToReceivingStreamListener(*feedback);
    FeedbackBooks& books = _assembly.feedbackBooks;
    books.record(_storageHandle ? FeedbackFate::Open : FeedbackFate::NoContainer);
    if (!_storageHandle) return;
    auto done = [&books, call = std::move(call), queue = _sessionQueue,
                 kept = _assembly.testFeedbacks ? _sessionFeedbacks : nullptr, feedback](bool written) {
        if (!written) books.move(FeedbackFate::Open, FeedbackFate::RefusedAppend, 1);
        if (kept) queue->async([kept, feedback] { kept->push_back(feedback); });
    };
    auto notOpen = [&books] { books.move(FeedbackFate::Open, FeedbackFate::NoContainer, 1); };
    _storageHandle->writeFeedback(std::move(feedback), platform::Reply<bool>(std::move(done), std::move(notOpen)));
}

void ClientSession::sessionComplete()
{
    _sessionQueue->sync([this] {
        if (!_storageHandle) return log(kLogSession).fault("Storage Handle nil major error");
        _assembly.persistentStorage->closeSessionWithFileContainer(_storageHandle);
    });
}

Feedbacks ClientSession::getSessionFeedbacks()
{
    Feedbacks feedbacks = _sessionQueue->sync([this] { return *_sessionFeedbacks; });
    sortByTimestamp(feedbacks);
    return feedbacks;
}

Value::Array ClientSession::feedbacksWithRelativeTimestamp()
{
    const Feedbacks feedbacks = getSessionFeedbacks();
    Value::Array events;
    for (const auto& feedback : feedbacks) {
        TavrinFeedback shown = *feedback;
        shown.relTimestamp = mach_duration_to_milliseconds(shown.timestamp() - feedbacks.front()->timestamp());
        events.emplace_back(shown.dictionary());
    }
    return events;
}

std::shared_ptr<ClientSession> ClientSession::createFeedbackSessionFromError(const platform::Error& error,
                                                                             Assembly& assembly)
{
    return std::make_shared<ClientSession>(assembly, ClientSessionManager::errorFeedback(error, assembly));
}

} // namespace tavrin
