// The road of a client's request: bag, skip rules, cache, service, reply, feedback. Search takes every step; the other
// kinds leave some out.

#include <fmt/format.h>

#include "CoreTavrin/ClientVocabulary.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVFeedback.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/device/Device.h"
#include "platform/run/Clock.h"
#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "searchrecords/ZRNetworkFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/ClientState.h"
#include "tavrind/ClientStateManager.h"
#include "tavrind/FeedbackRecords.h"
#include "tavrind/QueryCache.h"
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
using platform::UrlRequest;
using platform::UrlResponse;
using platform::Value;

namespace {

constexpr unsigned kRetries = 3;

enum SkipReason : std::int64_t {
    kLessThanMinimumQueryLength = 1,
    kBagDisabled = 2,
    kBagFetchFailed = 3,
    kCacheHit = 4
};

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

/// One request on its way, from its arrival to its reply.
struct ClientState::Exchange {
    std::shared_ptr<TAVRequest> request;
    RequestReply reply;
    unsigned logCategory;
    const char* what; // for log lines: "zkw query"

    std::shared_ptr<const TAVBag> bag;
    std::optional<std::string> userAgent;
    std::uint64_t fieldMask = 0;
    EndpointType endpoint = EndpointType::TavrinSearch;
    bool isSearch = false;
    /// Sent again after a transport error, until `expire`.
    bool retryable = false;
    std::optional<platform::Date> expire;

    UrlRequest httpRequest;
    std::shared_ptr<ZRStartNetworkSearchFeedback> start;

    [[nodiscard]] const platform::Log& log() const { return TavrinLogForCategory(logCategory); }
    void answer(std::shared_ptr<TAVReply> record, OptionalError error)
    {
        reply(request->queryId, std::move(record), std::move(error));
    }
};

ClientState::ExchangePtr ClientState::_exchange(std::shared_ptr<TAVRequest> request, RequestReply reply,
                                                unsigned logCategory, const char* what)
{
    return std::make_shared<Exchange>(
        Exchange{.request = std::move(request), .reply = std::move(reply), .logCategory = logCategory, .what = what});
}

/// Ends the exchange where there is no bag, or a disabled one; else goes on with the exchange's bag set.
void ClientState::_withBag(ExchangePtr exchange, std::move_only_function<void()> then)
{
    _ensureBag([self = shared_from_this(), exchange, then = std::move(then)](bool ensured) mutable {
        std::tie(exchange->bag, exchange->userAgent) =
            self->_queue->sync([&] { return std::pair(self->_bag, self->_userAgent); });
        if (!ensured || !exchange->bag) {
            if (exchange->isSearch)
                exchange->log().error("Bag fetch failed, can't complete non-cached query {}.",
                                      exchange->request->queryString);
            else
                exchange->log().error("Bag fetch failed, can't complete non-cached {}.", exchange->what);
            exchange->answer(nullptr, makeTAVError(TAVErrorTimeout, "timeout"));
            return self->_skipSearch(*exchange, kBagFetchFailed);
        }
        if (tavrin_caseInsensitiveContainsString(*exchange->userAgent, "messages"))
            exchange->fieldMask = kFieldMaskNoLocation;
        then();
    });
}

void ClientState::search(std::shared_ptr<TAVSearchRequest> request, RequestReply reply)
{
    const platform::Log& log = TavrinLogForCategory(kLogSearch);
    log.log("session {} performing query[{}] {}, reply {}", _identifier, request->queryId, request->queryString,
            reply ? "expected" : "none");
    if (_clientShortName) _assembly.diagnosticData.addValue(1, createCounterKey(*_clientShortName, "keystrokes"));

    auto exchange = _exchange(request, std::move(reply), kLogSearch, "query");
    exchange->isSearch = true;
    _withBag(exchange, [self = shared_from_this(), exchange, &log] {
        const TAVRequest& query = *exchange->request;
        if (!exchange->bag->isEnabled()) {
            log.log("no search, bag disabled");
            exchange->answer(nullptr, {});
            return self->_skipSearch(*exchange, kBagDisabled);
        }
        if (platform::utf16Length(query.queryString) < exchange->bag->minimumQueryLength()) {
            log.log("query[{}] input '{}' less than minQueryLength", query.queryId, query.queryString);
            exchange->answer(nullptr, {});
            return self->_skipSearch(*exchange, kLessThanMinimumQueryLength);
        }
        if (self->_answerFromCache(*exchange)) return;

        log.log("Dispatching network request for (id, query): ({}, {})", query.queryId, query.queryString);
        self->_send(exchange,
                    self->_assembly.requestFactory->searchRequest(query, *exchange->bag, self->_currentUserGUID(),
                                                                  exchange->fieldMask, self->_requestTimeout()),
                    query.queryString);
    });
}

void ClientState::zeroKeyword(std::shared_ptr<TAVZeroKeywordRequest> request, RequestReply reply)
{
    const platform::Log& log = TavrinLogForCategory(kLogZeroKeyword);
    log.log("session {} performing zkw query, reply {}", _identifier, reply ? "expected" : "none");
    auto exchange = _exchange(request, std::move(reply), kLogZeroKeyword, "zkw query");
    _withBag(exchange, [self = shared_from_this(), exchange, &log] {
        if (!exchange->bag->isEnabled()) {
            log.log("no zkw, bag disabled");
            return exchange->answer(nullptr, {});
        }
        log.log("Dispatching network request for zkw query");
        self->_send(exchange,
                    self->_assembly.requestFactory->zeroKeywordRequest(*exchange->request, *exchange->bag,
                                                                       self->_currentUserGUID(), exchange->fieldMask,
                                                                       self->_requestTimeout()),
                    exchange->request->queryString);
    });
}

void ClientState::moreResults(std::shared_ptr<TAVMoreResultsRequest> request, RequestReply reply)
{
    auto exchange = _exchange(request, std::move(reply), kLogMoreResults, "more results query");
    exchange->log().log("session {} performing more results query", _identifier);
    std::tie(exchange->bag, exchange->userAgent) = _queue->sync([this] { return std::pair(_bag, _userAgent); });
    if (exchange->userAgent && tavrin_caseInsensitiveContainsString(*exchange->userAgent, "messages"))
        exchange->fieldMask = kFieldMaskNoLocation;
    exchange->retryable = true;
    _send(exchange,
          _assembly.requestFactory->moreResultsRequest(*request, exchange->bag.get(), exchange->userAgent,
                                                       _currentUserGUID(), exchange->fieldMask, _requestTimeout()),
          request->moreResultsURL ? request->moreResultsURL->queryValue("q").value_or("") : "");
}

void ClientState::card(std::shared_ptr<TAVCardRequest> request, RequestReply reply)
{
    auto exchange = _exchange(request, std::move(reply), kLogCard, "card query");
    exchange->log().log("session {} performing card query", _identifier);
    exchange->endpoint = EndpointType::TavrinCard;
    exchange->retryable = true;
    _withBag(exchange, [self = shared_from_this(), exchange, request] {
        if (!exchange->bag->isEnabled()) {
            exchange->log().log("no card, bag disabled");
            return exchange->answer(nullptr, {});
        }
        self->_send(exchange,
                    self->_assembly.requestFactory->cardRequest(*request, *exchange->bag, self->_currentUserGUID(),
                                                                self->_requestTimeout()),
                    request->queryString);
    });
}

void ClientState::lookup(std::shared_ptr<TAVLookupRequest> request, RequestReply reply)
{
    auto exchange = _exchange(request, std::move(reply), kLogLookUp, "lookup query");
    exchange->log().log("session {} performing lookup query", _identifier);
    _withBag(exchange, [self = shared_from_this(), exchange, request] {
        if (!exchange->bag->isEnabled()) {
            exchange->log().log("no lookup, bag disabled");
            exchange->answer(nullptr, {});
            return self->_skipSearch(*exchange, kBagDisabled);
        }
        auto httpRequest = self->_assembly.requestFactory->lookupRequest(
            *request, *exchange->bag, self->_currentUserGUID(), self->_requestTimeout());
        exchange->retryable = true;
        const auto timeout = httpRequest ? httpRequest->timeout : std::nullopt;
        exchange->expire = self->_assembly.device.clock.wallNow() + timeout.value_or(std::chrono::seconds(60));
        self->_send(exchange, std::move(httpRequest), request->queryString);
    });
}

void ClientState::flightSearch(std::shared_ptr<TAVRequest> request, RequestReply reply)
{
    auto exchange = _exchange(std::move(request), std::move(reply), kLogFlight, "flight query");
    exchange->log().log("session {} performing flight query", _identifier);
    _withBag(exchange, [self = shared_from_this(), exchange] {
        if (!exchange->bag->isEnabled()) {
            exchange->log().log("no flights, bag disabled");
            return exchange->answer(nullptr, {});
        }
        self->_send(exchange,
                    self->_assembly.requestFactory->flightRequest(*exchange->request, *exchange->bag,
                                                                  self->_currentUserGUID(), self->_requestTimeout()),
                    exchange->request->queryString);
    });
}

void ClientState::flightLookup(std::shared_ptr<TAVRequest> request, RequestReply reply)
{
    flightSearch(std::move(request), std::move(reply));
}

/// A set cached for a completion of what was typed. A query with items of its own always goes to the service.
bool ClientState::_answerFromCache(Exchange& exchange)
{
    if (!_queryCache) return false;
    _answersQueue->sync([] {}); // what was answered is in the cache
    const TAVRequest& query = *exchange.request;
    const auto hit = _queryCache->getRequest(query);
    if (!hit || !query.queryItems.empty()) return false;

    auto reply = std::make_shared<TAVReply>();
    reply->scale = query.scale;
    if (query.verboseReply) reply->httpRequest = record(*hit->request);
    reply->rawResponse = hit->answer;
    reply->geoSessionEntityString = _assembly.requestFactory->getMapsUserSessionEntity();
    exchange.answer(std::move(reply), {});

    if (_clientShortName)
        _assembly.diagnosticData.addValue(1, createCounterKey(*_clientShortName, "ondevicecachehits"));
    _skipSearch(exchange, kCacheHit, hit->uuid);
    return true;
}

/// Records the start and sends the request; one that could not be built ends in an error.
void ClientState::_send(ExchangePtr exchange, std::optional<UrlRequest> request, std::string input)
{
    if (!request) {
        const Error error = makeTAVError(TAVErrorInvalidResponse, "no URL");
        exchange->log().error("no URL for the {}", exchange->what);
        exchange->answer(nullptr, error);
        return _addFeedback(std::make_shared<ZRErrorFeedback>(error), exchange->request->queryId,
                            exchange->request->clientQueryId);
    }
    exchange->httpRequest = std::move(*request);
    if (platform::Log::enabled(platform::LogLevel::Debug))
        exchange->log().debug("request: {} header: {}", exchange->httpRequest.url.string(),
                              describe(exchange->httpRequest.headers));

    const auto* lookup = dynamic_cast<const TAVLookupRequest*>(exchange->request.get());
    exchange->start = lookup ? std::make_shared<TAVLookupStartNetworkSearchFeedback>(
                                   std::move(input), exchange->httpRequest.url.string(),
                                   headerDictionary(exchange->httpRequest.headers), lookup->triggerEvent,
                                   exchange->endpoint, lookup->selectionType)
                             : startNetworkSearchFeedback(std::move(input), exchange->httpRequest,
                                                          exchange->request->triggerEvent, exchange->endpoint);
    _addFeedback(exchange->start, exchange->request->queryId, exchange->request->clientQueryId);

    // No further attempt is made for a request that isn't retryable.
    dataTaskWithRetryableRequest(
        _assembly.device, _assembly.urlSession,
        {.httpRequest = exchange->httpRequest, .expire = exchange->expire, .delayOnFail = false}, 1,
        exchange->retryable ? kRetries : 0,
        [self = shared_from_this(), exchange](auto data, auto response, auto error, const Value& timingData) {
            self->_completed(exchange, std::move(data), std::move(response), std::move(error), timingData);
        })
        ->resume();

    if (exchange->isSearch) {
        _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.search");
        _setPerformedSearch();
    }
    _markNetworkRequest();
}

void ClientState::_completed(ExchangePtr exchange, std::optional<Bytes> data, std::optional<UrlResponse> response,
                             std::optional<Error> error, const Value& timingData)
{
    const TAVRequest& query = *exchange->request;
    const int statusCode = response ? response->statusCode : 0;
    if (response) recordSearchResult(statusCode);
    const std::size_t responseSize = data ? data->size() : 0;
    if (exchange->isSearch)
        exchange->log().log("Got network response for (id, query): ({}, {})", query.queryId, query.queryString);
    else
        exchange->log().log("Got network response for {}", exchange->what);
    exchange->log().debug("resp: {}", statusCode);

    if (error || !data) {
        exchange->log().error("error with request {}", error ? error->description() : "no data");
        exchange->answer(nullptr, error);
        return failSearchFeedback(*exchange, error, responseSize, statusCode, timingData);
    }
    if (!response || !response->isHttp) {
        exchange->log().error("not http response? {}", response ? response->url.string() : "none");
        error = makeTAVError(TAVErrorInvalidResponse, "invalid response class");
        exchange->answer(nullptr, error);
        return failSearchFeedback(*exchange, error, responseSize, statusCode, timingData);
    }

    auto decoded = JsonDocument::parse(data->view());
    const auto document = decoded ? std::make_shared<const JsonDocument>(std::move(*decoded)) : nullptr;
    // The reply needs the text alone. What is to be cached is on its way there by then: whoever has the reply finds it.
    const bool cached = document && _mayCache(*document, *exchange);
    const auto useAnswer = [self = shared_from_this(), exchange, document] { self->_useAnswer(*exchange, *document); };
    if (cached) _answersQueue->async(useAnswer);

    auto reply = std::make_shared<TAVReply>();
    reply->scale = query.scale;
    if (query.verboseReply) {
        reply->httpRequest = record(exchange->httpRequest);
        reply->httpResponse = record(*response);
    }
    if (document) reply->rawResponse = *data;
    reply->geoSessionEntityString = _assembly.requestFactory->getMapsUserSessionEntity();
    exchange->answer(std::move(reply), document ? OptionalError() : decoded.error());

    if (document && !cached) _assembly.device.globalQueue(platform::Priority::Default)->async(useAnswer);
    endNetworkFeedback(*exchange, document.get(), responseSize, statusCode, timingData);
    _forceFetch(*response);
}

/// What is made of an answer besides the reply: images are fetched ahead, result sets cached.
void ClientState::_useAnswer(const Exchange& exchange, const JsonDocument& document)
{
    const bool preload = _queue->sync([this] { return !_configuration || !_configuration->dontPreloadImages; });
    const bool cached = _mayCache(document, exchange);
    if (!preload && !cached) return;
    const Value response = document.value();
    if (preload) _assembly.clientStateManager->processImagesFromResponse(response, exchange.bag);
    if (cached) _cacheResponse(response, exchange);
}

void ClientState::_forceFetch(const UrlResponse& response)
{
    const std::string* header = response.headers.find("X-Quorvane-ForceFetch");
    if (!header) return;
    const auto announcement = platform::parseJson(*header);
    if (announcement && announcement->asDictionary() && bag())
        return _assembly.bagController->forceFetchBag(*announcement);
    TavrinLogForCategory(kLogSearch)
        .error("Failed to deserialize X-Quorvane-ForceFetch header data into a dictionary: {}", *header);
}

/// True if some result set names the query that it completes, without which none is cached.
bool ClientState::_mayCache(const JsonDocument& answer, const Exchange& exchange) const
{
    return exchange.isSearch && _queryCache && !exchange.request->queryString.empty() && answer.anyElementHas("query");
}

void ClientState::_cacheResponse(const Value& response, const Exchange& exchange)
{
    const auto request = std::make_shared<const UrlRequest>(exchange.httpRequest);
    const platform::Date now = _assembly.device.clock.wallNow();
    for (const Value& set : *response.asArray()) {
        if (!set.asDictionary()) continue;
        const std::string* status = set["status"].asString();
        if (status && *status == "ERROR") continue;
        _queryCache->set(std::make_shared<const CachedResultSet>(exchange.request->queryString, request, set,
                                                                 exchange.start->uuid.value_or(""), now));
    }
}

void ClientState::_addFeedback(std::shared_ptr<ZRFeedback> record, std::int64_t queryId, std::uint64_t clientQueryId)
{
    record->timestamp = _assembly.device.clock.hostTicks();
    if (const auto manager = sessionManager())
        manager->addTavrinFeedback(
            std::make_shared<TavrinFeedback>(std::move(record), queryId, "", userAgent().value_or(""), clientQueryId));
}

void ClientState::_skipSearch(const Exchange& exchange, std::int64_t reason, std::optional<std::string> uuid)
{
    _addFeedback(std::make_shared<TAVSkipSearchFeedback>(exchange.request->queryString,
                                                         static_cast<SkipSearchTrigger>(reason), std::move(uuid)),
                 exchange.request->queryId, exchange.request->clientQueryId);
}

void ClientState::recordSearchResult(int statusCode)
{
    if (const auto agent = userAgent())
        _assembly.diagnosticData.addValue(
            1, createCounterKey(*agent, fmt::format("fedapicall.serverstatus.{}", statusCode)));
}

void ClientState::failSearchFeedback(const Exchange& exchange, const std::optional<Error>& error,
                                     std::size_t responseSize, int statusCode, const Value& timingData)
{
    const TAVRequest& query = *exchange.request;
    if (error) {
        if (const auto agent = userAgent())
            _assembly.diagnosticData.addValue(1, createCounterKey(*agent, "noconnection"));
    }
    _addFeedback(std::make_shared<ZRErrorFeedback>(error), query.queryId, query.clientQueryId);
    _addFeedback(std::make_shared<ZREndNetworkSearchFeedback>(exchange.start, responseSize, statusCode, timingData),
                 query.queryId, query.clientQueryId);
}

void ClientState::endNetworkFeedback(const Exchange& exchange, const JsonDocument* rawResponse,
                                     std::size_t responseSize, int statusCode, const Value& timingData)
{
    std::shared_ptr<ZRFeedback> record;
    if (rawResponse && rawResponse->count() > 0) {
        const auto first = [rawResponse](std::string_view key) { return rawResponse->entryOfFirst(key); };
        record = std::make_shared<TAVEndNetworkSearchFeedback>(
            exchange.start, responseSize, statusCode, textIn(first("status")), first("duration").asDouble().value_or(0),
            textIn(first("fbq")), textIn(first("partial_client_ip")), timingData);
    } else {
        record = std::make_shared<ZREndNetworkSearchFeedback>(exchange.start, responseSize, statusCode, timingData);
    }
    _addFeedback(std::move(record), exchange.request->queryId);
}

} // namespace tavrin
