#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/base/Uuid.h"
#include "platform/net/UrlSession.h"
#include "platform/run/NotificationCenter.h"
#include "platform/run/Queue.h"
#include "platform/values/Json.h"

namespace platform {
class JsonDocument;
}

namespace tavrin {

struct Assembly;
struct TAVCardRequest;
struct TAVLookupRequest;
struct TAVMoreResultsRequest;
struct TAVSearchRequest;
struct TAVZeroKeywordRequest;
struct ZRFeedback;
struct ZRStartNetworkSearchFeedback;
class ClientSessionManager;
class QueryCache;
class TavrinUserGUIDController;

/// The search engine of one client: its view of the bag, its query cache, and the way from a request over the service
/// to the reply and its feedback. All connections of one client share one, for the life of the process.
///
/// Bag: none until a user agent is known; then waited for, 1 s at most, by whoever needs it; then held, and replaced
/// with every new one. Another user agent makes the view anew and empties the cache.
///
/// Requests must be made from a task of a serial queue (the connection's), which is held back while a request waits for
/// the first bag, so that a connection's requests keep their order. Every request is answered once. Everything else:
/// any thread.
class ClientState : public std::enable_shared_from_this<ClientState> {
public:
    ClientState(std::string identifier, Assembly& assembly);
    ~ClientState();

    /// Tells the client's user agent, and asks for its view of the bag.
    void bag(const std::optional<std::string>& userAgent, BagReply reply);
    /// Opens the connection to the service ahead of a search.
    void warm();

    void search(std::shared_ptr<TAVSearchRequest> request, RequestReply reply);
    void zeroKeyword(std::shared_ptr<TAVZeroKeywordRequest> request, RequestReply reply);
    void moreResults(std::shared_ptr<TAVMoreResultsRequest> request, RequestReply reply);
    void card(std::shared_ptr<TAVCardRequest> request, RequestReply reply);
    void lookup(std::shared_ptr<TAVLookupRequest> request, RequestReply reply);
    void flightSearch(std::shared_ptr<TAVRequest> request, RequestReply reply);
    void flightLookup(std::shared_ptr<TAVRequest> request, RequestReply reply);

    [[nodiscard]] const std::string& identifier() const { return _identifier; }
    [[nodiscard]] const std::optional<std::string>& clientShortName() const { return _clientShortName; }
    [[nodiscard]] std::optional<std::string> userAgent() const;
    void setUserAgent(std::string userAgent);
    void setConfiguration(std::shared_ptr<TAVSessionConfiguration> configuration);
    [[nodiscard]] std::shared_ptr<const TAVBag> bag() const;
    /// Where the client's feedback goes; null only while the daemon starts.
    [[nodiscard]] std::shared_ptr<ClientSessionManager> sessionManager() const;
    [[nodiscard]] std::shared_ptr<TavrinUserGUIDController> guidController() const;

private:
    struct Exchange;
    using ExchangePtr = std::shared_ptr<Exchange>;

    // The bag.
    void _ensureBag(std::move_only_function<void(bool)> then);
    void _storeBagFrom(const TAVBag& bag);
    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);

    // The road of a request, step by step (ClientStateRequests.cpp).
    [[nodiscard]] ExchangePtr _exchange(std::shared_ptr<TAVRequest> request, RequestReply reply, unsigned logCategory,
                                        const char* what);
    void _withBag(ExchangePtr exchange, std::move_only_function<void()> then);
    [[nodiscard]] bool _answerFromCache(Exchange& exchange);
    void _send(ExchangePtr exchange, std::optional<platform::UrlRequest> request, std::string input);
    void _completed(ExchangePtr exchange, std::optional<platform::Bytes> data,
                    std::optional<platform::UrlResponse> response, std::optional<platform::Error> error,
                    const platform::Value& timingData);
    void _useAnswer(const Exchange& exchange, const platform::JsonDocument& document);
    [[nodiscard]] bool _mayCache(const platform::JsonDocument& answer, const Exchange& exchange) const;
    void _cacheResponse(const platform::Value& response, const Exchange& exchange);
    void _forceFetch(const platform::UrlResponse& response);

    // Feedback and counters.
    void _addFeedback(std::shared_ptr<ZRFeedback> record, std::int64_t queryId, std::uint64_t clientQueryId = 0);
    void _skipSearch(const Exchange& exchange, std::int64_t reason, std::optional<std::string> uuid = {});
    void recordSearchResult(int statusCode);
    void failSearchFeedback(const Exchange& exchange, const std::optional<platform::Error>& error,
                            std::size_t responseSize, int statusCode, const platform::Value& timingData);
    void endNetworkFeedback(const Exchange& exchange, const platform::JsonDocument* rawResponse,
                            std::size_t responseSize, int statusCode, const platform::Value& timingData);
    [[nodiscard]] platform::Uuid _currentUserGUID() const;
    void _setPerformedSearch();
    void _markNetworkRequest();
    [[nodiscard]] std::optional<platform::Duration> _requestTimeout() const;

    Assembly& _assembly;
    const std::string _identifier;
    const std::optional<std::string> _clientShortName;
    std::shared_ptr<QueryCache> _queryCache;                      // null: switched off
    std::shared_ptr<TavrinUserGUIDController> _ownGuidController; // null: shared
    std::shared_ptr<ClientSessionManager> _ownSessionManager;

    std::shared_ptr<platform::Queue> _answersQueue; // answers on their way into the cache
    std::shared_ptr<platform::Queue> _queue;        // guards all below
    std::shared_ptr<TAVSessionConfiguration> _configuration;
    std::optional<std::string> _userAgent;
    std::shared_ptr<const TAVBag> _bag;
    std::optional<platform::Date> _lastNetworkRequest;
    platform::NotificationCenter::Token _bagObserver;
    platform::Event _bagArrived;
};

} // namespace tavrin
