#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/net/UrlSession.h"
#include "searchrecords/ZREnums.h"
#include "tavrind/ClientState.h"

namespace platform {
class JsonDocument;
} // namespace platform

namespace tavrin {

struct CachedResultSet;
struct RequestKind;
struct ZRStartNetworkSearchFeedback;

/// One request of a client, from its arrival to its reply and its feedback:
///
///     begin ──► first bag ──► skip rules ──► query cache ──► sent ──► completed
///                   │             │               │                       │
///                   └─────────────┴───────┬───────┴───────────────────────┘
///                                         ▼
///                                       reply ──► feedback
///
/// All kinds of request take these steps; their differences are in `RequestKind`. The reply is called exactly once. The
/// performer of the next step owns the exchange: first the queue that waits for the bag, then the loader's task. Steps
/// that write members never run concurrently with other steps, so members need no lock.
class Exchange : public std::enable_shared_from_this<Exchange> {
public:
    Exchange(Assembly& assembly, std::shared_ptr<ClientState> client, const RequestKind& kind,
             std::shared_ptr<TAVRequest> request, RequestReply reply);
    ~Exchange();

    /// Starts the exchange. Call it once, in a task of a serial queue; the queue is suspended while the request waits
    /// for the first bag.
    void begin();

private:
    void _perform(bool hasBag);
    [[nodiscard]] bool _isSkipped();
    [[nodiscard]] bool _answerFromCache();
    void _send();
    void _completed(std::optional<platform::Bytes> data, std::optional<platform::UrlResponse> response,
                    std::optional<platform::Error> error, const platform::Value& timingData);
    void _answer(std::shared_ptr<TAVReply> record, OptionalError error);
    [[nodiscard]] bool _mayCache(const platform::JsonDocument& answer) const;
    [[nodiscard]] std::vector<std::shared_ptr<const CachedResultSet>>
    _useAnswer(const std::shared_ptr<const platform::JsonDocument>& document, platform::UrlSource source, bool cached);
    void _forceFetch(const platform::UrlResponse& response);

    void _addFeedback(std::shared_ptr<ZRFeedback> record, std::uint64_t clientQueryId);
    void _skipSearch(SkipSearchTrigger reason, std::optional<std::string> uuid = {});
    /// Counts the request under `kind`, with the time since `begun`, in host ticks.
    void _count(std::string_view kind, std::uint64_t begun, bool failed);
    void recordSearchResult(int statusCode);
    void failSearchFeedback(const std::optional<platform::Error>& error, std::size_t responseSize, int statusCode,
                            const platform::Value& timingData);
    void endNetworkFeedback(const platform::JsonDocument* rawResponse, std::size_t responseSize, int statusCode,
                            const platform::Value& timingData);

    Assembly& _assembly;
    const std::shared_ptr<ClientState> _client;
    const RequestKind& _kind;
    const std::shared_ptr<TAVRequest> _request;
    RequestReply _reply;

    std::uint64_t _begun = 0;           // in host ticks
    std::uint64_t _completedAt = 0;     // likewise: the end of the network request
    ClientView _view;                   // the client after the wait for the bag; read again before the request is built
    std::uint64_t _cacheGeneration = 0; // of the query cache, before the request was built
    platform::UrlRequest _httpRequest;  // as sent
    std::shared_ptr<ZRStartNetworkSearchFeedback> _start;
};

} // namespace tavrin
