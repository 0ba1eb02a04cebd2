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

/// Selects subscriptions of content providers.
struct SubscriptionQuery {
    std::vector<std::string> bundleIdentifiers; ///< a provider's application must be one of these,
    std::vector<std::string> domains;           ///< or one of its domains, in any letter case
    Duration maximumExpiration{};               ///< how long a statement counts after it was written
};

/// The user's subscriptions with content providers, as the providers' applications state them. Any thread.
class SubscriptionServices {
public:
    virtual ~SubscriptionServices() = default;
    /// Returns the complete statements of active providers, by provider.
    [[nodiscard]] virtual Result<std::map<std::string, Value>> activeServices(const SubscriptionQuery& query) = 0;
    /// Calls `handler` on the run loop's thread after every change. One handler; a new one replaces it.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// Reads the files "*.json" in a directory, one for each provider. Each is an object with
///
/// - "provider" (text): the provider; of several files the last by name counts;
/// - "bundleIdentifier" (text) and "domains" (texts), which queries match; either may be missing;
/// - "active" (boolean, by default true): false leaves the subscription out;
/// - "expires" (seconds since 1970): the end, which the query may bring forward;
///
/// and whatever else the service is to know. A missing directory means no subscriptions. Other files are logged and
/// left out, and so are files beyond 4 KiB and beyond the 64th. Reads on request; watches from the first `onChange` on.
/// Destroyed on the run loop's thread; all arguments must outlive it.
[[nodiscard]] std::unique_ptr<SubscriptionServices>
makeSubscriptionServices(FileSystem& files, std::filesystem::path directory, RunLoop& runLoop, Clock& clock);

/// Returns true if a statement written at `written` counts for the query at `now`.
[[nodiscard]] bool isActiveSubscription(const Value& service, Date written, const SubscriptionQuery& query, Date now);

} // namespace platform
