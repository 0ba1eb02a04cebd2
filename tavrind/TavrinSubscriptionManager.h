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

/// Receives the results of the subscription manager, on the manager's queue.
class TavrinSubscriptionManagerDelegate {
public:
    virtual ~TavrinSubscriptionManagerDelegate() = default;
    virtual void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) = 0;
    /// `subscriptions` has one dictionary for each provider, "fuse" first; an empty list removes the header.
    virtual void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) = 0;
};

/// Returns the request header that lists the subscriptions: a JSON array, or an empty text if there are none.
///
/// Servers refuse requests with large headers, so this one has at most 4 KiB. A subscription that does not fit is left
/// out completely, and logged. Any thread.
[[nodiscard]] std::string subscriptionsHeader(const std::vector<platform::Value>& subscriptions);

/// Collects the user's content subscriptions that requests may report, and the media store's storefront.
///
/// These are the subscriptions with the providers that the bag lists, and the maker's news subscription, "fuse". They
/// are collected again after every new bag and whenever the device's profile or a provider's statement changes. If the
/// bag lacks one of its two lists of providers, there are none. Any thread.
class TavrinSubscriptionManager : public std::enable_shared_from_this<TavrinSubscriptionManager> {
public:
    /// Starts observing the bag, the profile and the providers, and reports the storefront to the delegate. The
    /// assembly must outlive the manager.
    static std::shared_ptr<TavrinSubscriptionManager> make(Assembly& assembly,
                                                           std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);
    TavrinSubscriptionManager(Assembly& assembly, std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);

    /// Returns one dictionary for each provider, "fuse" first.
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
