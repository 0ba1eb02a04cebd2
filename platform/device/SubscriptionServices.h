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
    std::vector<std::string> bundleIdentifiers; ///< matches a provider whose application is one of these,
    std::vector<std::string> domains;           ///< or that has one of these domains, ignoring case
    Duration maximumExpiration{};               ///< how long a file counts after it was written
};

/// The user's subscriptions with content providers, as the providers' applications state them. Any thread.
class SubscriptionServices {
public:
    virtual ~SubscriptionServices() = default;
    /// Returns the complete statements of active providers that match the query, by provider. Fails if the directory
    /// can't be read.
    [[nodiscard]] virtual Result<std::map<std::string, Value>> activeServices(const SubscriptionQuery& query) = 0;
    /// Calls `handler` on the run loop's thread after every change. One handler; a new one replaces it.
    virtual void onChange(std::function<void()> handler) = 0;
};

/// Returns the subscriptions in the files "*.json" of a directory, one file for each provider. Each is an object with
///
/// - "provider" (text): the provider; if several files name the same, the last by name counts;
/// - "bundleIdentifier" (text) and "domains" (texts), which queries match; either may be missing;
/// - "active" (boolean, by default true): false disables the subscription;
/// - "expires" (seconds since 1970): the end, unless `maximumExpiration` ends it earlier;
///
/// and further members for the search service. A missing directory has no subscriptions. Invalid files, files of more
/// than 4 KiB and files after the 64th are logged and ignored. Reads on request; observes the directory from the first
/// `onChange` on. Destroy it on the run loop's thread; the arguments must outlive it.
[[nodiscard]] std::unique_ptr<SubscriptionServices>
makeSubscriptionServices(FileSystem& files, std::filesystem::path directory, RunLoop& runLoop, Clock& clock);

/// Returns true if a statement that was written at `written` matches the query and is active at `now`.
[[nodiscard]] bool isActiveSubscription(const Value& service, Date written, const SubscriptionQuery& query, Date now);

} // namespace platform
