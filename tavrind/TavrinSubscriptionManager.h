#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/run/NotificationCenter.h"
#include "platform/values/Value.h"

namespace platform {
class Queue;
}

namespace tavrin {

struct Assembly;
class TAVBag;

/// Receives what the subscription manager finds out, on the manager's queue.
class TavrinSubscriptionManagerDelegate {
public:
    virtual ~TavrinSubscriptionManagerDelegate() = default;
    virtual void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) = 0;
    /// One dictionary for each provider, "fuse" first. An empty list removes the header.
    virtual void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) = 0;
};

/// The request header that tells the service the subscriptions: a JSON array, or nothing for none.
///
/// Servers refuse requests with large headers, so this one has at most 4 KiB. Subscriptions that no longer fit are left
/// out whole, and logged. Any thread.
[[nodiscard]] std::string subscriptionsHeader(const std::vector<platform::Value>& subscriptions);

/// Gathers the user's content subscriptions that the bag lets requests tell, and the media store's storefront.
///
/// Subscriptions are those with the providers that the bag lists, and the maker's own news subscription, "fuse". They
/// are gathered again after every new bag and whenever the device's profile or a provider's statement changes. A bag
/// without its two lists of providers leaves none. Any thread.
class TavrinSubscriptionManager : public std::enable_shared_from_this<TavrinSubscriptionManager> {
public:
    /// Starts observing these and tells the delegate the storefront. The assembly must outlive the manager.
    static std::shared_ptr<TavrinSubscriptionManager> make(Assembly& assembly,
                                                           std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);
    TavrinSubscriptionManager(Assembly& assembly, std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);

    /// One dictionary for each provider, "fuse" first.
    [[nodiscard]] std::vector<platform::Value> subscriptions() const;

private:
    void onQueue(void (TavrinSubscriptionManager::*step)());
    void _initializeStorefront();
    void _profileChanged();
    void _updateStorefrontIdentifier(const std::optional<std::string>& storefront);
    void _updateSubscriptions();
    void _setSubscriptions(std::map<std::string, platform::Value> subscriptionsByProvider);
    void _updateDelegate();
    [[nodiscard]] std::vector<platform::Value> values() const;

    Assembly& _assembly;
    const std::weak_ptr<TavrinSubscriptionManagerDelegate> _delegate;
    const std::shared_ptr<platform::Queue> _queue; // guards all below
    std::map<std::string, platform::Value> _subscriptionsByProvider;
    std::shared_ptr<const TAVBag> _bag;
    platform::NotificationCenter::Token _bagObserver;
};

} // namespace tavrin
