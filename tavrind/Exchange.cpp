#include "tavrind/Exchange.h"

#include <algorithm>
#include <functional>

#include <fmt/format.h>

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/net/UrlRedirect.h"
#include "platform/run/Clock.h"
#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/QueryCache.h"
#include "tavrind/RequestKind.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TAVRetryableNetworkRequest.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

using platform::Bytes;
using platform::Error;
using platform::JsonDocument;
using platform::JsonView;
using platform::Private;
using platform::UrlRequest;
using platform::UrlResponse;
using platform::Value;

namespace {

/// Limit of the values of a response: ten times those of the largest ordinary one.
constexpr std::size_t kMaximumValues = 1u << 18;
constexpr std::chrono::seconds kDefaultTimeout{60}; ///< the loader's

std::shared_ptr<TAVHTTPRequest> record(const UrlRequest& request)
{
    auto result = std::make_shared<TAVHTTPRequest>();
    result->url = request.url.string();
    result->method = request.method;
    result->headers = headerDictionary(request.headers);
    return result;
}

std::shared_ptr<TAVHTTPResponse> record(const UrlResponse& response)
{
    auto result = std::make_shared<TAVHTTPResponse>();
    result->url = response.url.string();
    result->statusCode = response.statusCode;
    result->headers = headerDictionary(response.headers);
    return result;
}

std::optional<std::string> textIn(const Value& value)
{
    const std::string* text = value.asString();
    return text ? std::optional(*text) : std::nullopt;
}

} // namespace

Exchange::Exchange(Assembly& assembly, std::shared_ptr<ClientState> client, const RequestKind& kind,
                   std::shared_ptr<TAVRequest> request, RequestReply reply)
    : _assembly(assembly), _client(std::move(client)), _kind(kind), _request(std::move(request)),
      _reply(std::move(reply))
{}

Exchange::~Exchange() = default;

void Exchange::_answer(std::shared_ptr<TAVReply> reply, OptionalError error)
{
    _reply(_request->queryId, std::move(reply), std::move(error));
}

void Exchange::begin()
{
    _begun = _assembly.device.clock.hostTicks();
    const platform::Log& log = TavrinLogForCategory(_kind.logCategory);
    if (_kind.isSearch) {
        log.log("session {} performing query[{}] {}, reply {}", _client->identifier(), _request->queryId,
                Private{_request->queryString}, _reply ? "expected" : "none");
        if (const auto& name = _client->clientShortName())
            _assembly.diagnosticData.addValue(1, createCounterKey(*name, "keystrokes"));
    } else {
        log.log("session {} performing {}, reply {}", _client->identifier(), _kind.name, _reply ? "expected" : "none");
    }
    if (!_kind.needsBag) return _perform(true);
    _client->_ensureBag([self = shared_from_this()](bool hasBag) { self->_perform(hasBag); });
}

void Exchange::_perform(bool hasBag)
{
    _view = _client->view();
    const platform::Log& log = TavrinLogForCategory(_kind.logCategory);
    if (_kind.needsBag && (!hasBag || !_view.bag)) {
        if (_kind.isSearch)
            log.error("Bag fetch failed, can't complete non-cached query {}.", Private{_request->queryString});
        else
            log.error("Bag fetch failed, can't complete non-cached {}.", _kind.name);
        _answer(nullptr, makeTAVError(TAVErrorTimeout, "timeout"));
        return _skipSearch(SkipSearchTrigger::BagFetchFailed);
    }
    if (_isSkipped() || (_kind.isSearch && _answerFromCache())) return;
    _send();
}

/// If the bag's rules forbid the request, replies without record and error and returns true.
bool Exchange::_isSkipped()
{
    const platform::Log& log = TavrinLogForCategory(_kind.logCategory);
    if (_kind.needsBag && !_view.bag->isEnabled()) {
        log.log("no {}, bag disabled", _kind.topic);
        _answer(nullptr, {});
        if (_kind.skipsWhenDisabled) _skipSearch(SkipSearchTrigger::BagDisabled);
        return true;
    }
    if (_kind.isSearch && platform::utf16Length(_request->queryString) < _view.bag->minimumQueryLength()) {
        log.log("query[{}] input '{}' less than minQueryLength", _request->queryId, Private{_request->queryString});
        _answer(nullptr, {});
        _skipSearch(SkipSearchTrigger::LessThanMinimumQueryLength);
        return true;
    }
    return false;
}

/// If the cache has a set for a completion of the typed text, replies with it and returns true. A query with additional
/// query items is always sent to the service.
bool Exchange::_answerFromCache()
{
    const auto& cache = _client->queryCache();
    if (!cache) return false;
    const auto hit = cache->getRequest(*_request);
    if (!hit || !_request->queryItems.empty()) return false;

    auto reply = std::make_shared<TAVReply>();
    reply->scale = _request->scale;
    if (_request->verboseReply) reply->httpRequest = record(*hit->request);
    reply->rawResponse = hit->answer;
    reply->geoSessionEntityString = _assembly.requestFactory->getMapsUserSessionEntity();
    _answer(std::move(reply), {});

    _count("memory", _begun, false);
    if (const auto& name = _client->clientShortName())
        _assembly.diagnosticData.addValue(1, createCounterKey(*name, "ondevicecachehits"));
    _skipSearch(SkipSearchTrigger::CacheHit, hit->uuid);
    return true;
}

/// Records the start and sends the request. If the request can't be built, replies with an error instead.
void Exchange::_send()
{
    const platform::Log& log = TavrinLogForCategory(_kind.logCategory);
    if (_kind.isSearch)
        log.log("Dispatching network request for (id, query): ({}, {})", _request->queryId,
                Private{_request->queryString});
    else
        log.log("Dispatching network request for {}", _kind.name);

    const auto guids = _client->guidController();
    // Only for a request that is about to be built: reading the GUID may replace it, which empties query caches.
    if (guids) {
        (void)guids->currentUserGUID();
        (void)guids->lastKnownUserGUID(); // returns after they were emptied
    }
    // If the cache is emptied after this point, the answer belongs to an earlier state and is not cached.
    if (const auto& cache = _client->queryCache()) _cacheGeneration = cache->generation();
    _view = _client->view();
    const double timeout = _view.configuration ? _view.configuration->timeoutIntervalForRequest : 0;
    const std::string userAgent = _view.userAgent.value_or("");
    const platform::Uuid userGuid = guids ? guids->currentUserGUID() : platform::Uuid();
    const ClientRequest parts{.request = *_request,
                              .bag = _view.bag.get(),
                              .userGuid = userGuid,
                              .userAgent = userAgent,
                              .fieldMask = fieldMaskFor(userAgent),
                              .timeout = timeout > 0 ? std::optional(requestTimeout(timeout)) : std::nullopt};
    auto built = std::invoke(_kind.builder, *_assembly.requestFactory, parts);
    if (!built) {
        const Error error = makeTAVError(TAVErrorInvalidResponse, "no URL");
        log.error("no URL for the {}", _kind.name);
        _answer(nullptr, error);
        return _addFeedback(std::make_shared<ZRErrorFeedback>(error), _request->clientQueryId);
    }
    _httpRequest = std::move(*built);
    if (platform::Log::enabled(platform::LogLevel::Debug))
        log.debug("request: {} header: {}", _httpRequest.url.string(), describe(_httpRequest.headers));

    _start = _kind.startRecord(*_request, _httpRequest, _kind.endpoint);
    _addFeedback(_start, _request->clientQueryId);

    std::optional<platform::Date> expire;
    if (_kind.expires) expire = _assembly.device.clock.wallNow() + _httpRequest.timeout.value_or(kDefaultTimeout);
    dataTaskWithRetryableRequest(
        _assembly.device, _assembly.urlSession, {.httpRequest = _httpRequest, .expire = expire, .delayOnFail = false},
        1, _kind.retries,
        [self = shared_from_this()](auto data, auto response, auto error, const Value& timingData) {
            self->_completed(std::move(data), std::move(response), std::move(error), timingData);
        })
        ->resume();

    if (_kind.isSearch) {
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.search");
        _assembly.requestFactory->setPerformedSearch();
    }
    _client->_markNetworkRequest();
}

void Exchange::_completed(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error,
                          const Value& timingData)
{
    const platform::Log& log = TavrinLogForCategory(_kind.logCategory);
    const int statusCode = response ? response->statusCode : 0;
    _completedAt = _assembly.device.clock.hostTicks();
    if (response) recordSearchResult(statusCode);
    _count(_kind.name, _start->timestamp, error || statusCode < 200 || statusCode > 299);
    const std::size_t responseSize = data ? data->size() : 0;
    if (_kind.isSearch)
        log.log("Got network response for (id, query): ({}, {})", _request->queryId, Private{_request->queryString});
    else
        log.log("Got network response for {}", _kind.name);
    log.debug("resp: {}", statusCode);

    if (error || !data) {
        log.error("error with request {}", error ? error->description() : "no data");
        _answer(nullptr, error);
        return failSearchFeedback(error, responseSize, statusCode, timingData);
    }
    if (!response || !response->isHttp) {
        log.error("not http response? {}", Private{response ? response->url.string() : "none"});
        error = makeTAVError(TAVErrorInvalidResponse, "invalid response class");
        _answer(nullptr, error);
        return failSearchFeedback(error, responseSize, statusCode, timingData);
    }

    auto decoded = JsonDocument::parse(data->view(), data->size(), kMaximumValues);
    const auto document = decoded ? std::make_shared<const JsonDocument>(std::move(*decoded)) : nullptr;
    const platform::UrlSource source = platform::sourceOf(*response);
    // All work after the reply is one task, because a second task would wake another thread.
    auto afterReply = [self = shared_from_this(), document, source, responseSize, statusCode, timingData](bool cached) {
        self->endNetworkFeedback(document.get(), responseSize, statusCode, timingData);
        return self->_useAnswer(document, source, cached);
    };
    // The store is queued before the reply, so that a client that has received an answer finds it in the cache. The
    // reply needs only the text, so the sets are created on the cache's queue.
    const bool cached = document && _mayCache(*document);
    if (cached) _client->queryCache()->setMade([afterReply] { return afterReply(true); }, _cacheGeneration);

    auto reply = std::make_shared<TAVReply>();
    reply->scale = _request->scale;
    if (_request->verboseReply) {
        reply->httpRequest = record(_httpRequest);
        reply->httpResponse = record(*response);
    }
    if (document) reply->rawResponse = *data;
    reply->geoSessionEntityString = _assembly.requestFactory->getMapsUserSessionEntity();
    _answer(std::move(reply), document ? OptionalError() : decoded.error());

    if (!document)
        endNetworkFeedback(nullptr, responseSize, statusCode, timingData);
    else if (!cached)
        _assembly.device.globalQueue(platform::Priority::Default)->async([afterReply = std::move(afterReply)] {
            (void)afterReply(false);
        });
    _forceFetch(*response);
}

/// Returns true if the answer may be cached: it must have a result set with a "query".
bool Exchange::_mayCache(const JsonDocument& answer) const
{
    return _kind.isSearch && _client->queryCache() && !_request->queryString.empty() &&
           std::ranges::any_of(answer.root().elements(), [](JsonView set) { return set.has("query"); });
}

/// Starts the prefetch of the answer's images, and returns the result sets to cache. Runs on the cache's queue, or on a
/// global queue if nothing is to be cached.
std::vector<std::shared_ptr<const CachedResultSet>>
Exchange::_useAnswer(const std::shared_ptr<const JsonDocument>& document, platform::UrlSource source, bool cached)
{
    if (!_view.configuration || !_view.configuration->dontPreloadImages)
        _assembly.clientStateManager->processImagesFromResponse(document, _view.bag, source);
    if (!cached) return {};

    std::vector<std::shared_ptr<const CachedResultSet>> sets;
    const auto request = std::make_shared<const UrlRequest>(_httpRequest);
    const platform::Date now = _assembly.device.clock.wallNow();
    for (const JsonView set : document->root().elements()) {
        if (!set.isDictionary() || set["status"].asString() == "ERROR") continue;
        sets.push_back(std::make_shared<const CachedResultSet>(_request->queryString, request, set,
                                                               _start->uuid.value_or(""), now));
    }
    return sets;
}

void Exchange::_forceFetch(const UrlResponse& response)
{
    const std::string* header = response.headers.find("X-Quorvane-ForceFetch");
    if (!header) return;
    const auto announcement = platform::parseJson(*header);
    if (announcement && announcement->asDictionary() && _client->bag())
        return _assembly.bagController->forceFetchBag(*announcement);
    log(kLogSearch).error("Failed to deserialize X-Quorvane-ForceFetch header data into a dictionary: {}", *header);
}

void Exchange::_addFeedback(std::shared_ptr<ZRFeedback> record, std::uint64_t clientQueryId)
{
    if (record->timestamp == 0) record->timestamp = _assembly.device.clock.hostTicks();
    if (const auto manager = _client->sessionManager())
        manager->addTavrinFeedback(std::make_shared<TavrinFeedback>(std::move(record), _request->queryId, "",
                                                                    _view.userAgent.value_or(""), clientQueryId));
}

void Exchange::_skipSearch(SkipSearchTrigger reason, std::optional<std::string> uuid)
{
    _addFeedback(std::make_shared<TAVSkipSearchFeedback>(_request->queryString, reason, std::move(uuid)),
                 _request->clientQueryId);
}

void Exchange::_count(std::string_view kind, std::uint64_t begun, bool failed)
{
    const std::uint64_t now = _assembly.device.clock.hostTicks();
    _assembly.requestFigures.record(kind, platform::Duration(static_cast<std::int64_t>(now - begun)), failed);
}

void Exchange::recordSearchResult(int statusCode)
{
    if (_view.userAgent)
        _assembly.diagnosticData.addValue(
            1, createCounterKey(*_view.userAgent, fmt::format("fedapicall.serverstatus.{}", statusCode)));
}

void Exchange::failSearchFeedback(const std::optional<Error>& error, std::size_t responseSize, int statusCode,
                                  const Value& timingData)
{
    if (error && _view.userAgent)
        _assembly.diagnosticData.addValue(1, createCounterKey(*_view.userAgent, "noconnection"));
    _addFeedback(std::make_shared<ZRErrorFeedback>(error), _request->clientQueryId);
    _addFeedback(std::make_shared<ZREndNetworkSearchFeedback>(_start, responseSize, statusCode, timingData),
                 _request->clientQueryId);
}

void Exchange::endNetworkFeedback(const JsonDocument* rawResponse, std::size_t responseSize, int statusCode,
                                  const Value& timingData)
{
    std::shared_ptr<ZRFeedback> record;
    if (const auto sets = rawResponse ? rawResponse->root().elements() : std::vector<JsonView>(); !sets.empty()) {
        const auto first = [&sets](std::string_view key) { return sets.front()[key].value(); };
        record = std::make_shared<TAVEndNetworkSearchFeedback>(
            _start, responseSize, statusCode, textIn(first("status")), first("duration").asDouble().value_or(0),
            textIn(first("fbq")), textIn(first("partial_client_ip")), timingData);
    } else {
        record = std::make_shared<ZREndNetworkSearchFeedback>(_start, responseSize, statusCode, timingData);
    }
    record->timestamp = _completedAt; // a client may report what it shows before this runs
    _addFeedback(std::move(record), 0);
}

} // namespace tavrin
