#include "tavrind/TavrinBagController.h"

#include <algorithm>
#include <cctype>
#include <ranges>

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/run/Clock.h"
#include "platform/run/Transactions.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/PropertyList.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSession.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/Flags.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TAVRetryableNetworkRequest.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using platform::Error;
using platform::Url;
using platform::Value;

namespace {

constexpr double kTrustedForSeconds = 14400;
constexpr double kStaleAheadSeconds = 600;
/// Seconds by which the clock may be set back before a fresh bag counts as expired.
constexpr double kClockTolerance = 1;
constexpr std::size_t kMaximumBagSize = 8u << 20;
/// Property lists have texts beyond ASCII in UTF-16.
constexpr std::size_t kMaximumBagFile = 2 * kMaximumBagSize + (1u << 20);
/// Limit of values in a bag: the time to write its property list grows with their square.
constexpr std::size_t kMaximumBagValues = 1u << 14;
constexpr std::size_t kLoggedProblems = 20;
/// Time limit of a fetch with its retries. Without it, a hanging fetch would prevent all others.
constexpr platform::Duration kFetchLimit = std::chrono::minutes(2);
constexpr platform::Duration kFirstAnnouncementInterval = std::chrono::minutes(1);
constexpr platform::Duration kLongestAnnouncementInterval = std::chrono::hours(4);
constexpr const char* kExpirationKey = "__expiration";
constexpr const char* kBagUrlKey = "__bagurl";
constexpr const char* kBagUrlDefault = "TAVBagURL";
constexpr const char* kNewsUserAgent = "news/1.0";
constexpr unsigned kFetchRetries = 5;

} // namespace

BagStaleness bagStaleness(std::optional<double> expiration, const std::string* cachedUrl, platform::Date now,
                          const std::function<std::string()>& currentUrl)
{
    // If more time is left than a fetch grants, the clock was wrong then or is wrong now. NaN compares false: also
    // expired.
    const double left = expiration.value_or(0) - platform::secondsSince1970(now);
    if (!(left >= kStaleAheadSeconds && left <= kTrustedForSeconds + kClockTolerance)) return BagStaleness::Expired;
    if (!cachedUrl) return BagStaleness::NoUrl;
    return *cachedUrl == currentUrl() ? BagStaleness::Fresh : BagStaleness::UrlChanged;
}

double bagExpiration(platform::Date fetched)
{
    return platform::secondsSince1970(fetched) + kTrustedForSeconds;
}

bool versionPrecedes(std::string_view a, std::string_view b)
{
    const auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
    const auto takeNumber = [&](std::string_view& text) {
        const std::size_t end = std::ranges::find_if_not(text, isDigit) - text.begin();
        std::string_view number = text.substr(0, end);
        text.remove_prefix(end);
        number.remove_prefix(std::min(number.find_first_not_of('0'), number.size()));
        return number;
    };
    while (!a.empty() && !b.empty()) {
        if (isDigit(a.front()) && isDigit(b.front())) {
            const std::string_view x = takeNumber(a);
            const std::string_view y = takeNumber(b);
            if (x.size() != y.size()) return x.size() < y.size();
            if (x != y) return x < y;
        } else {
            if (a.front() != b.front()) return a.front() < b.front();
            a.remove_prefix(1);
            b.remove_prefix(1);
        }
    }
    return a.size() < b.size();
}

bool AnnouncedVersion::take(std::string_view version, std::string_view current, std::uint64_t now)
{
    const bool delivered = !versionPrecedes(current, _version);
    if (delivered && versionPrecedes(_version, version)) {
        _interval = kFirstAnnouncementInterval;
    } else if (now < _due) {
        return false;
    } else {
        _interval = std::min(2 * _interval, kLongestAnnouncementInterval);
    }
    _version = version;
    _due = now + static_cast<std::uint64_t>(_interval.count());
    return true;
}

/// One fetch, from its request to its completion.
struct TavrinBagController::Fetch {
    platform::Transactions::Token transaction; // keeps the process alive until the end
    std::shared_ptr<ClientSession> session;
    std::shared_ptr<ZRStartNetworkSearchFeedback> start;
    std::string userGuid;
    std::string url;
    std::string cacheUrl; // of the bag cache request, before the request was built: the country may change meanwhile
    Value timingData;
    Completion completion;
    platform::Clock::TimerId limit = 0;
    std::atomic<bool> tookTooLong = false;
};

std::shared_ptr<TavrinBagController> TavrinBagController::make(Assembly& assembly)
{
    auto controller = std::make_shared<TavrinBagController>(assembly);
    Value cached = controller->diskCachedBagDictionary();
    if (!cached.isNull() && controller->_isRefreshRequiredForCachedBag(cached))
        controller->_fetchBagStateWithVersion({});
    if (!cached.isNull())
        controller->cacheBagState(std::make_shared<const TAVBag>(std::move(cached), controller->_userAgent), true);
    controller->_refreshObserver = assembly.notificationCenter.observe(
        TAVBagRefreshRequired,
        [weak = controller->weak_from_this(), &device = assembly.device](const platform::Notification&) {
            // The notification is posted on the main queue, whose thread must not block.
            device.globalQueue(platform::Priority::Default)->async([weak] {
                if (auto self = weak.lock()) self->_handleRefreshNotification();
            });
        },
        assembly.requestFactory.get());
    return controller;
}

TavrinBagController::TavrinBagController(Assembly& assembly)
    : _assembly(assembly), _inMemoryBagCacheAccessQueue(assembly.device.concurrentQueue(
                               "com.quorvane.tavrind.bagcontroller.cacheaccess", rank::kStore)),
      _userAgent(ClientSessionManager::tavrindUserAgent())
{}

TavrinBagController::~TavrinBagController() = default;

Url TavrinBagController::bagFetchURLWithCountry(const std::string& country) const
{
    if (const auto configured = _assembly.userDefaults.string(kBagUrlDefault)) {
        if (auto url = Url::parse(*configured); url && !url->host().empty()) return *url;
        log(kLogBag).error("Malformed tavrin bag URL in user defaults key {}", kBagUrlDefault);
    }
    const bool china = country.size() == 2 && std::toupper(static_cast<unsigned char>(country[0])) == 'C' &&
                       std::toupper(static_cast<unsigned char>(country[1])) == 'N';
    return Url::parse(china ? TAVRIND_BAG_URL_CN : TAVRIND_BAG_URL).value_or(Url());
}

std::shared_ptr<const TAVBag> TavrinBagController::inMemoryBag() const
{
    return _inMemoryBagCacheAccessQueue->sync([this] { return _inMemoryBag; });
}

std::shared_ptr<const TAVBag> TavrinBagController::currentBag()
{
    auto bag = cachedBagState();
    if (!bag) _fetchBagStateWithVersion({});
    return bag;
}

std::shared_ptr<const TAVBag> TavrinBagController::cachedBagState()
{
    auto bag = inMemoryBag();
    if (bag && _isRefreshRequiredForCachedBag(bag->rawBag())) {
        _assembly.device.globalQueue(platform::Priority::Default)->async([weak = weak_from_this()] {
            if (auto self = weak.lock()) self->_fetchBagStateWithVersion({});
        });
    }
    return bag;
}

std::optional<Url> TavrinBagController::warmURL()
{
    const auto bag = currentBag();
    return bag ? bag->warmURL() : std::nullopt;
}

void TavrinBagController::forceFetchBag(const Value& announcement)
{
    const Value& announced = announcement["bag"];
    const auto bag = inMemoryBag();
    if (!bag || !announced.isNumber()) return;
    const std::string version = platform::toJson(announced);
    if (_fetchInProgress || !versionPrecedes(bag->version(), version)) return;
    const std::uint64_t now = _assembly.device.clock.hostTicks();
    if (_inMemoryBagCacheAccessQueue->barrierSync([&] { return _announced.take(version, bag->version(), now); }))
        _fetchBagStateWithVersion(version);
}

std::string TavrinBagController::_bagCacheURL()
{
    // The generation is read first: if the context changes after that, the next call builds the URL again.
    const std::uint64_t context = _assembly.requestFactory->bagContextGeneration();
    auto configured = _assembly.userDefaults.string(kBagUrlDefault);
    auto known = _cacheUrl.load();
    if (!known || known->context != context || known->configured != configured) {
        known = std::make_shared<const CacheUrl>(
            context, std::move(configured),
            _assembly.requestFactory->bagCacheRequest(*this, _userAgent, {}).url.string());
        _cacheUrl = known;
    }
    return known->url;
}

bool TavrinBagController::_isRefreshRequiredForCachedBag(const Value& rawBag)
{
    const std::optional<double> expiration = rawBag[kExpirationKey].asDouble();
    const std::string* cachedUrl = rawBag[kBagUrlKey].asString();
    const platform::Date now = _assembly.device.clock.wallNow();
    std::string currentUrl;
    switch (bagStaleness(expiration, cachedUrl, now, [&] { return currentUrl = _bagCacheURL(); })) {
    case BagStaleness::Fresh: return false;
    case BagStaleness::Expired:
        log(kLogBag).log("bag expired: {:f}", expiration.value_or(0) - platform::secondsSince1970(now));
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.bag.expired");
        return true;
    case BagStaleness::UrlChanged:
        log(kLogBag).log("bag url changed from: {} to {}", *cachedUrl, currentUrl);
        return true;
    case BagStaleness::NoUrl: log(kLogBag).log("no bag URL found in cache"); return true;
    }
    return true;
}

platform::Result<std::string> TavrinBagController::_pathToCachedBag()
{
    const auto& caches = _assembly.device.directories.caches;
    if (auto made = _assembly.fileManager.createDirectories(caches); !made) {
        log(kLogBag).error("error getting cache directory {}", made.error().description());
        return std::unexpected(made.error());
    }
    const auto directory = caches / "com.quorvane.tavrind";
    if (auto made = _assembly.fileManager.createDirectories(directory); !made) {
        log(kLogBag).error("error creating agent-specific cache directory {}", made.error().description());
        return std::unexpected(made.error());
    }
    return (directory / "bag.plist").string();
}

Value TavrinBagController::diskCachedBagDictionary()
{
    if (!Flags::diskBagCacheEnabled()) {
        log(kLogBag).log("skipping check for bag on disk because the flag is disabled");
        return {};
    }
    const auto path = _pathToCachedBag();
    if (!path) return {};
    const auto bytes = _assembly.fileManager.read(*path, kMaximumBagFile);
    if (!bytes && bytes.error().domain == platform::kPosixErrorDomain && bytes.error().code == ENOENT) return {};
    auto bag = bytes ? platform::parsePropertyList(bytes->view(), kMaximumBagFile) : std::unexpected(bytes.error());
    if (!bag) {
        log(kLogBag).fault("Error reading from bag cache: {}.", bag.error().description());
        return {};
    }
    if (!bag->asDictionary()) {
        log(kLogBag).log("Unexpected class deserialized from bag cache: {}.", platform::typeName(bag->type()));
        return {};
    }
    return std::move(*bag); // stale or not
}

Value TavrinBagController::_dictionaryToCacheBag(const Value& fetched, const std::string& cacheUrl)
{
    Value bag = fetched;
    platform::Dictionary& entries = bag.mutableDictionary();
    entries.set(kExpirationKey, bagExpiration(_assembly.device.clock.wallNow()));
    entries.set(kBagUrlKey, cacheUrl);
    return bag;
}

Value TavrinBagController::cacheBagDictionary(const Value& fetched, const std::string& cacheUrl)
{
    Value bag = _dictionaryToCacheBag(fetched, cacheUrl);
    if (!Flags::diskBagCacheEnabled()) {
        log(kLogBag).log("skipping writing bag to disk because the flag is disabled");
        return bag;
    }
    const auto path = _pathToCachedBag();
    if (!path) {
        log(kLogBag).error("Couldn't get path to cache bag.  Error: {}.", path.error().description());
        return bag;
    }
    const auto list = platform::toPropertyList(bag);
    if (!list)
        log(kLogBag).error("Error writing bag to persistent cache: {}.", list.error().description());
    else if (auto written = _assembly.fileManager.writeAtomically(*path, *list); !written)
        log(kLogBag).error("Could not write to {} ({})", *path, written.error().reason());
    return bag;
}

void TavrinBagController::cacheBagState(std::shared_ptr<const TAVBag> bag, bool fromDisk)
{
    if (!bag) return;
    const std::vector<std::string> problems = bag->problems();
    for (const std::string& problem : problems | std::views::take(kLoggedProblems))
        log(kLogBag).error("bag: {}; using the default", problem);
    if (problems.size() > kLoggedProblems)
        log(kLogBag).error("bag: {} further entries are wrong", problems.size() - kLoggedProblems);
    enum : unsigned long { kDisabled, kEnabled, kUnknown };
    const auto newsState = [](const TAVBag* some) -> unsigned long {
        return !some ? kUnknown : TAVBag(some->rawBag(), kNewsUserAgent).isEnabled() ? kEnabled : kDisabled;
    };
    _inMemoryBagCacheAccessQueue->barrierSync([&] {
        const unsigned long before = newsState(_inMemoryBag.get());
        const unsigned long after = newsState(bag.get());
        _inMemoryBag = bag;
        _assembly.notificationCenter.post({.name = TAVBagChangeNotification, .userInfo = {{"bag", bag}}});
        if (before != after && !fromDisk) {
            log(kLogBag).log("setting Tavrin News Available status to {}", after);
            _assembly.device.systemNotifier.post(after == kEnabled ? kNewsEnabledNotifyName : kNewsDisabledNotifyName);
        }
    });
}

void TavrinBagController::_fetchBagStateWithVersion(const std::string& version)
{
    if (_fetchInProgress.exchange(true)) return;
    _fetchBagStateWithVersion(version, nullptr);
}

void TavrinBagController::_fetchBagStateWithVersion(const std::string& version, Completion completion)
{
    std::string cacheUrl = _bagCacheURL();
    platform::UrlRequest request = _assembly.requestFactory->bagFetchRequest(*this, _userAgent, version);
    request.maximumResponseSize = kMaximumBagSize;
    log(kLogBag).debug("Initiating bag fetch attempt with request {} header {}", request.url.string(),
                       describe(request.headers));

    auto fetch = std::make_shared<Fetch>();
    fetch->transaction = _assembly.device.transactions.begin("bagFetch");
    fetch->completion = std::move(completion);
    fetch->url = request.url.string();
    fetch->cacheUrl = std::move(cacheUrl);
    fetch->start = startNetworkSearchFeedback("", request, StartSearchTrigger::Bag, EndpointType::TavrinBag);
    fetch->start->timestamp = _assembly.device.clock.hostTicks();
    if (_assembly.guidController) fetch->userGuid = _assembly.guidController->currentUserGUID().string();
    fetch->session = std::make_shared<ClientSession>(
        _assembly, std::make_shared<TavrinFeedback>(fetch->start, 0, fetch->userGuid, _userAgent));

    auto task = dataTaskWithRetryableRequest(
        _assembly.device, _assembly.urlSession,
        {.httpRequest = request,
         .expire = std::nullopt,
         .delayOnFail = true,
         .failed =
             [weak = weak_from_this(), url = fetch->url](const Error& error) {
                 if (const auto self = weak.lock()) self->_noteAttempt(url, nullptr, &error);
             }},
        1, kFetchRetries, [weak = weak_from_this(), fetch](auto data, auto response, auto error, Value timingData) {
            auto self = weak.lock();
            if (!self) {
                log(kLogBag).log(
                    "Error fetching bag, bag fetch task completed after BagFetchController was cleaned up");
                return;
            }
            fetch->timingData = std::move(timingData);
            if (fetch->tookTooLong && error) error = platform::urlError(platform::kUrlTimedOut, "timed out");
            self->_fetchCompleted(*fetch, std::move(data), std::move(response), std::move(error));
        });
    fetch->limit =
        _assembly.device.clock.after(kFetchLimit, [fetch = std::weak_ptr(fetch), task = std::weak_ptr(task),
                                                   queue = _assembly.device.globalQueue(platform::Priority::Default)] {
            queue->async([fetch, task] {
                const auto late = fetch.lock();
                const auto running = task.lock();
                if (!late || !running) return;
                late->tookTooLong = true;
                running->cancel();
            });
        });
    task->resume();
}

void TavrinBagController::_fetchCompleted(Fetch& fetch, std::optional<platform::Bytes> data,
                                          std::optional<platform::UrlResponse> response, std::optional<Error> error)
{
    _assembly.device.clock.cancel(fetch.limit);
    const auto addFeedback = [&](std::shared_ptr<ZRFeedback> record) {
        record->timestamp = _assembly.device.clock.hostTicks();
        fetch.session->addFeedback(std::make_shared<TavrinFeedback>(std::move(record), 0, fetch.userGuid, _userAgent));
    };
    const int statusCode = response ? response->statusCode : 0;
    log(kLogBag).log("resp: {}", statusCode);
    addFeedback(std::make_shared<ZREndNetworkSearchFeedback>(fetch.start, data ? data->size() : 0, statusCode,
                                                             std::move(fetch.timingData)));

    std::shared_ptr<const TAVBag> bag;
    if (error) {
        log(kLogBag).error("Error fetching bag: {}", error->description());
    } else if (!data) {
        log(kLogBag).error("Error fetching bag: returned data was not of the expected type.");
        error = makeTAVError(TAVErrorBagFetch, "no data");
    } else if (statusCode != 200) {
        log(kLogBag).error("Error fetching bag status code: {}", statusCode);
        error = makeTAVError(TAVErrorBagFetch, fmt::format("statusCode {}", statusCode));
    } else if (auto document = platform::JsonDocument::parse(data->view(), kMaximumBagSize, kMaximumBagValues);
               !document) {
        log(kLogBag).error("error parsing bag json {}", document.error().description());
        error = document.error();
    } else if (const Value parsed = document->root().value(); !parsed.asDictionary()) {
        log(kLogBag).error("Error fetching bag: returned data was not of the expected type.");
        error = makeTAVError(TAVErrorBagFetch, "not JSON object");
    } else {
        log(kLogBag).log("Got bag: {}", platform::toJson(parsed));
        bag = std::make_shared<const TAVBag>(cacheBagDictionary(parsed, fetch.cacheUrl), _userAgent);
        cacheBagState(bag, false);
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.bag.fetches");
    }

    const std::uint64_t taken = _assembly.device.clock.hostTicks() - fetch.start->timestamp;
    _assembly.requestFigures.record("bag", platform::Duration(static_cast<std::int64_t>(taken)), error.has_value());
    _noteAttempt(fetch.url, response ? &*response : nullptr, error ? &*error : nullptr);
    if (error) {
        _inMemoryBagCacheAccessQueue->barrierSync([&] { _announced = {}; }); // the next announcement fetches again
        addFeedback(std::make_shared<ZRErrorFeedback>(*error));
        _assembly.notificationCenter.post({.name = TAVBagChangeNotification, .userInfo = {{"bagError", *error}}});
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.bag.fetchesfailed");
    }
    fetch.session->sessionComplete();
    if (fetch.completion) fetch.completion(bag, error);
    _fetchInProgress = false;
    fetch.transaction = {};
}

void TavrinBagController::_noteAttempt(const std::string& url, const platform::UrlResponse* response,
                                       const Error* error)
{
    platform::Dictionary attempt{{"at", platform::secondsSince1970(_assembly.device.clock.wallNow())}, {"url", url}};
    if (response) {
        attempt.set("status", response->statusCode);
        if (const std::string* date = response->headers.find("Date")) attempt.set("serverDate", *date);
    }
    if (error) {
        attempt.set("reason", error->reason().empty() ? error->description() : error->reason());
        attempt.set("code", error->code);
    }
    _lastFetch = std::make_shared<const Value>(std::move(attempt));
}

Value TavrinBagController::lastFetch() const
{
    const auto attempt = _lastFetch.load();
    return attempt ? *attempt : Value();
}

void TavrinBagController::_handleRefreshNotification()
{
    log(kLogBag).debug("something significant changed (locale, geo). checking to see if bag needs update");
    const auto bag = inMemoryBag();
    if (_isRefreshRequiredForCachedBag(bag ? bag->rawBag() : Value())) _fetchBagStateWithVersion({});
}

} // namespace tavrin
