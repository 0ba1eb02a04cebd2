#include "tavrind/TavrinSubscriptionManager.h"

namespace tavrin {

TavrinSubscriptionManager::TavrinSubscriptionManager(Assembly& assembly,
                                                     std::weak_ptr<TavrinSubscriptionManagerDelegate> delegate)
    : _assembly(assembly), _delegate(std::move(delegate))
{}

} // namespace tavrin
