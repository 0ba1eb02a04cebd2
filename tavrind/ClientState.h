#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/run/NotificationCenter.h"
#include "platform/run/Queue.h"

namespace tavrin {

struct Assembly;
struct RequestKind;
class ClientSessionManager;
class QueryCache;
class TavrinUserGUIDController;

/// Returns whether the connection to the service must be opened again before a search: nothing was sent for 30 s.
[[nodiscard]] bool needsWarming(std::optional<platform::Date> lastRequest, platform::Date now);

/// A snapshot of a client's state for its requests.
struct ClientView {
    std::shared_ptr<const TAVBag> bag;                            ///< null before the first one
    std::optional<std::string> userAgent;                         ///< nothing before the client has introduced itself
    std::shared_ptr<const TAVSessionConfiguration> configuration; ///< null before a client has configured
};

/// The daemon's state for one client: its view of the bag, its query cache, its session and GUID. `Exchange` performs
/// its requests. All connections of one client share one state, for the life of the process.
///
/// Bag: without a user agent there is none. Requests wait for the first bag, 1 s at most. From then on, each new bag
/// replaces the held one. A new user agent rebuilds the held bag and empties the cache.
///
/// Requests must be made in a task of a serial queue (the connection's). The queue is suspended while a request waits
/// for the first bag, so that a connection's requests keep their order. Every request is answered exactly once. All
/// other functions: any thread.
class ClientState : public std::enable_shared_from_this<ClientState> {
public:
    ClientState(std::string identifier, Assembly& assembly);
    ~ClientState();

    /// Stores the client's user agent, unless it is empty, and replies with the client's view of the bag.
    void bag(const std::optional<std::string>& userAgent, BagReply reply);
    /// Opens the connection to the service before a search, unless a request was sent in the last 30 s.
    void warm();

    /// Performs a request, whose kind must be `kind`. See `Exchange`.
    void perform(const RequestKind& kind, std::shared_ptr<TAVRequest> request, RequestReply reply);

    // The same for each kind.
    void search(std::shared_ptr<TAVSearchRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void zeroKeyword(std::shared_ptr<TAVZeroKeywordRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void moreResults(std::shared_ptr<TAVMoreResultsRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void card(std::shared_ptr<TAVCardRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void lookup(std::shared_ptr<TAVLookupRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void flightSearch(std::shared_ptr<TAVFlightSearchRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }
    void flightLookup(std::shared_ptr<TAVFlightLookupRequest> request, RequestReply reply)
    {
        _perform(std::move(request), std::move(reply));
    }

    [[nodiscard]] const std::string& identifier() const { return _identifier; }
    [[nodiscard]] const std::optional<std::string>& clientShortName() const { return _clientShortName; }
    /// Returns null if the user default "TAVNoQueryCache" disables the cache.
    [[nodiscard]] const std::shared_ptr<QueryCache>& queryCache() const { return _queryCache; }
    [[nodiscard]] ClientView view() const;
    [[nodiscard]] std::optional<std::string> userAgent() const { return view().userAgent; }
    [[nodiscard]] std::shared_ptr<const TAVBag> bag() const { return view().bag; }
    /// Restores a saved user agent. Unlike `bag`, does not rebuild the bag.
    void setUserAgent(std::string userAgent);
    void setConfiguration(std::shared_ptr<const TAVSessionConfiguration> configuration);
    /// Returns the session manager that receives the client's feedback; null only during start-up.
    [[nodiscard]] std::shared_ptr<ClientSessionManager> sessionManager() const;
    [[nodiscard]] std::shared_ptr<TavrinUserGUIDController> guidController() const;

private:
    friend class Exchange;

    void _perform(std::shared_ptr<TAVRequest> request, RequestReply reply);
    void _ensureBag(std::move_only_function<void(bool hasBag)> then);
    void _storeBagFrom(const TAVBag& bag);
    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);
    void _markNetworkRequest();

    Assembly& _assembly;
    const std::string _identifier;
    const std::optional<std::string> _clientShortName;
    std::shared_ptr<QueryCache> _queryCache;
    std::shared_ptr<TavrinUserGUIDController> _ownGuidController; // null: the assembly's is shared
    std::shared_ptr<ClientSessionManager> _ownSessionManager;     // null: the assembly's is shared

    std::shared_ptr<platform::Queue> _queue; // guards all below
    ClientView _view;
    std::optional<platform::Date> _lastNetworkRequest;
    platform::NotificationCenter::Token _bagObserver;
    std::shared_ptr<platform::Event> _bagFetch; // signalled when a bag arrives or its fetch fails
};

} // namespace tavrin
