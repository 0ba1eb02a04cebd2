#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Value.h"

namespace tavrin {

struct Assembly;

/// Who is told what the subscription manager finds out. Called on the manager's queue.
class TavrinSubscriptionManagerDelegate {
public:
    virtual ~TavrinSubscriptionManagerDelegate() = default;
    virtual void didUpdateStorefrontIdentifier(const std::optional<std::string>& storefront) = 0;
    /// One dictionary for each provider; none removes the header.
    virtual void didUpdateSubscriptionDictionaries(const std::vector<platform::Value>& subscriptions) = 0;
};

/// The user's content subscriptions, as far as requests may tell them. It knows of none. Any thread.
class TavrinSubscriptionManager {
public:
    TavrinSubscriptionManager(Assembly& assembly, std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate);
    [[nodiscard]] std::vector<platform::Value> subscriptions() const { return {}; }

private:
    Assembly& _assembly;
    std::weak_ptr<TavrinSubscriptionManagerDelegate> _delegate;
};

} // namespace tavrin
