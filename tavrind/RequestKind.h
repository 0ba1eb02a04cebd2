#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "platform/net/UrlSession.h"
#include "searchrecords/ZREnums.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TAVTracing.h"

namespace tavrin {

struct ClientRequest;
struct TAVRequest;
struct ZRStartNetworkSearchFeedback;
class TAVNetworkRequestFactory;

/// Creates the start record of a request, with its query as the input.
[[nodiscard]] std::shared_ptr<ZRStartNetworkSearchFeedback>
startRecordOf(const TAVRequest& request, const platform::UrlRequest& httpRequest, EndpointType endpoint);

/// The properties of one kind of client request. `Exchange` performs every kind with the same steps.
///
/// `builder` and `startRecord` accept only requests of the class `className`.
struct RequestKind {
    std::string_view className;
    TavrinLogCategory logCategory = kLogRequest;
    std::string_view name;  ///< in log lines: "zkw query"
    std::string_view topic; ///< in the log line about a disabled bag: "no zkw, bag disabled"
    EndpointType endpoint = EndpointType::TavrinSearch;
    TAVTraceCode traceStart = kTraceNone;
    TAVTraceCode traceAnswer = kTraceNone;
    bool isSearch = false; ///< ordered by query id, counted, has a minimum length, may be answered from the cache
    bool needsBag = true;  ///< waits for the first bag, and is not performed if the bag is disabled
    bool skipsWhenDisabled = false; ///< records a skip if the bag is disabled
    unsigned retries = 0;           ///< at most, after a failure; only if the request `expires`
    bool expires = false;           ///< retries end when its time-out has passed since the first attempt
    bool servedOnEndpoint = false;  ///< also served on the endpoint that `configure` returns
    std::optional<platform::UrlRequest> (TAVNetworkRequestFactory::*builder)(const ClientRequest&) = nullptr;
    std::shared_ptr<ZRStartNetworkSearchFeedback> (*startRecord)(const TAVRequest& request,
                                                                 const platform::UrlRequest& httpRequest,
                                                                 EndpointType endpoint) = startRecordOf;
};

/// Returns the kind of a request; null for a record of any other class, which is not served. Any thread.
[[nodiscard]] const RequestKind* kindOf(const TAVRequest& request);

} // namespace tavrin
