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

/// Who is told what the subscription manager finds out. Called on the manager's queue.
class TavrinSubscriptionManagerDelegate {
public:
    virtual ~TavrinSubscriptionManagerDelegate() = default;
    virtual void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) = 0;
    /// One dictionary for each provider; none removes the header.
    virtual void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) = 0;
};

/// The user's content subscriptions, as far as the bag lets requests tell them, and the media store's storefront.
///
/// Subscriptions are gathered anew with every bag, and when the device's profile or a provider's word changes: those of
/// the providers that the bag lists, and the maker's own news subscription, "fuse". A bag without its two lists of
/// providers leaves none. Any thread.
class TavrinSubscriptionManager : public std::enable_shared_from_this<TavrinSubscriptionManager> {
public:
    /// Begins to follow all these, and tells the delegate the storefront.
    static std::shared_ptr<TavrinSubscriptionManager> make(Assembly& assembly,
                                                           std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);
    TavrinSubscriptionManager(Assembly& assembly, std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);

    /// One dictionary for each provider.
    [[nodiscard]] std::vector<platform::Value> subscriptions() const;

private:
    /// Runs a step on the queue, soon.
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
