#pragma once

#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "platform/base/Date.h"
#include "platform/values/Error.h"

namespace platform {

class Clock;
class FileSystem;
class RunLoop;

/// Which subscriptions of content providers count.
struct SubscriptionQuery {
    std::vector<std::string> bundleIdentifiers; ///< a provider's application is one of these,
    std::vector<std::string> domains;           ///< or one of its domains is one of these, in any letter case
    Duration maximumExpiration{};               ///< how long a provider's word is trusted, from when it was written
};

/// The user's subscriptions with content providers, as the providers' applications tell them. Any thread.
class SubscriptionServices {
public:
    virtual ~SubscriptionServices() = default;
    /// What active providers tell of themselves, whole, by provider.
    [[nodiscard]] virtual Result<std::map<std::string, Value>> activeServices(const SubscriptionQuery& query) = 0;
    /// Called on the run loop's thread after a change. One handler.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// The files "*.json" in a directory, one for each provider: an object with
///
/// - "provider" (a text): whose it is; of several files the last by name counts;
/// - "bundleIdentifier" (a text), "domains" (texts): what queries match, either may be missing;
/// - "active" (a boolean; true): false leaves it out;
/// - "expires" (seconds since 1970): until when it is active; never longer than the query allows;
///
/// and whatever else the service is to know. No directory is no subscriptions. Files that aren't such objects are
/// logged and left out, as are those beyond 4 KiB and beyond 64 in number. Read when asked; watched from the first
/// `onChange` on.
[[nodiscard]] std::unique_ptr<SubscriptionServices>
makeSubscriptionServices(FileSystem& files, std::filesystem::path directory, RunLoop& runLoop, Clock& clock);

/// Whether a provider's word, written at `written`, counts for the query at `now`.
[[nodiscard]] bool isActiveSubscription(const Value& service, Date written, const SubscriptionQuery& query, Date now);

} // namespace platform
