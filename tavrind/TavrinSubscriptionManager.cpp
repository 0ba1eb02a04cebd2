#include "tavrind/TavrinSubscriptionManager.h"

#include "CoreTavrin/TAVBag.h"
#include "platform/device/Device.h"
#include "platform/device/DeviceProfile.h"
#include "platform/device/SubscriptionServices.h"
#include "platform/values/Json.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Value;

namespace {

constexpr const char* kFuse = "fuse";

} // namespace

std::string subscriptionsHeader(const std::vector<Value>& subscriptions)
{
    constexpr std::size_t kLongest = 4096; // half of what common servers accept for all headers
    std::string header;
    for (const Value& subscription : subscriptions) {
        std::string entry = (header.empty() ? "[" : ",") + platform::toJson(subscription);
        for (std::size_t at = 0; (at = entry.find('\x7f', at)) != std::string::npos;)
            entry.replace(at, 1, "\\u007f"); // JSON has it bare in strings, a header field must not
        if (header.size() + entry.size() + 1 > kLongest)
            log(kLogSubscription)
                .error("subscription with {} is not sent: the header has at most {} bytes",
                       platform::toJson(subscription["provider"]), kLongest);
        else
            header += entry;
    }
    return header.empty() ? header : header + "]";
}

std::shared_ptr<TavrinSubscriptionManager>
TavrinSubscriptionManager::make(Assembly& assembly, std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate)
{
    auto manager = std::make_shared<TavrinSubscriptionManager>(assembly, std::move(delegate));
    const std::weak_ptr weak = manager;
    assembly.device.subscriptions.onChange([weak] {
        if (const auto self = weak.lock()) self->onQueue(&TavrinSubscriptionManager::_updateSubscriptions);
    });
    assembly.device.profile.onChange([weak](const platform::DeviceProfile&) {
        if (const auto self = weak.lock()) self->onQueue(&TavrinSubscriptionManager::_profileChanged);
    });
    manager->_bagObserver = assembly.notificationCenter.observe(
        TAVBagChangeNotification, [weak](const platform::Notification& notification) {
            const auto self = weak.lock();
            auto bag = notification.get<std::shared_ptr<const TAVBag>>("bag");
            if (!self || !bag) return;
            self->_queue->async([weak, bag = std::move(bag)] {
                const auto again = weak.lock();
                if (!again) return;
                again->_bag = bag;
                again->_updateSubscriptions();
            });
        });
    manager->onQueue(&TavrinSubscriptionManager::_initializeStorefront);
    return manager;
}

TavrinSubscriptionManager::TavrinSubscriptionManager(Assembly& assembly,
                                                     std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate)
    : _assembly(assembly), _delegate(std::move(delegate)),
      _queue(assembly.device.serialQueue("com.quorvane.tavrin.subscriptionsByProvider-Queue", rank::kStore))
{}

std::vector<Value> TavrinSubscriptionManager::subscriptions() const
{
    return _queue->sync([this] { return values(); });
}

void TavrinSubscriptionManager::onQueue(void (TavrinSubscriptionManager::*step)())
{
    _queue->async([weak = weak_from_this(), step] {
        if (const auto self = weak.lock()) (self.get()->*step)();
    });
}

void TavrinSubscriptionManager::_initializeStorefront()
{
    _updateStorefrontIdentifier(_assembly.device.profile.profile().storefront);
}

void TavrinSubscriptionManager::_profileChanged()
{
    _initializeStorefront();
    _updateSubscriptions();
}

void TavrinSubscriptionManager::_updateStorefrontIdentifier(const std::optional<std::string>& storefront)
{
    if (const auto delegate = _delegate.lock()) delegate->didUpdateStorefrontIdentifier(storefront);
}

void TavrinSubscriptionManager::_updateSubscriptions()
{
    _queue->assertOnQueue();
    log(kLogSubscription).info("updating subscriptions");
    const auto domains = _bag ? _bag->subscriptionProviderDomainWhitelist() : std::nullopt;
    const auto bundles = _bag ? _bag->subscriptionProviderBundleIdentifierWhitelist() : std::nullopt;
    if (!domains || !bundles) {
        _subscriptionsByProvider.clear();
        return _updateDelegate();
    }

    auto services = _assembly.device.subscriptions.activeServices(
        {.bundleIdentifiers = *bundles,
         .domains = *domains,
         .maximumExpiration = platform::durationFromSeconds(_bag->subscriptionTTL())});
    if (!services)
        log(kLogSubscription)
            .error("Error fetching third party subscription information from daemon: {}",
                   services.error().description());
    std::map<std::string, Value> all = services ? std::move(*services) : std::map<std::string, Value>();
    all[kFuse] = Value::dictionaryOf(
        {{"provider", kFuse}, {"attribute", "premium"}, {"active", _assembly.device.profile.profile().newsSubscribed}});
    _setSubscriptions(std::move(all));
}

void TavrinSubscriptionManager::_setSubscriptions(std::map<std::string, Value> subscriptionsByProvider)
{
    if (subscriptionsByProvider == _subscriptionsByProvider) return;
    _subscriptionsByProvider = std::move(subscriptionsByProvider);
    _updateDelegate();
}

void TavrinSubscriptionManager::_updateDelegate()
{
    if (const auto delegate = _delegate.lock()) delegate->didUpdateSubscriptionDictionaries(values());
}

std::vector<Value> TavrinSubscriptionManager::values() const
{
    std::vector<Value> all;
    for (const auto& [provider, subscription] : _subscriptionsByProvider)
        all.insert(provider == kFuse ? all.begin() : all.end(), subscription);
    return all;
}

} // namespace tavrin
