#pragma once

#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <string_view>

#include "platform/base/Date.h"
#include "tavrind/DeepLinks.h"

namespace tavrin {

struct Assembly;

/// Twice a day, while the device is not in use, reports the content that applications showed in the last 24 hours to
/// the privacy recorder (docs/privacy.md).
class TavrinDPAppDeepLinkIngester : public std::enable_shared_from_this<TavrinDPAppDeepLinkIngester> {
public:
    /// Prefix of the recorder's keys.
    static constexpr std::string_view appDeepLinkKey = "com.quorvane.tavrin.AppDeepLink";
    /// Directory of the database of activities, relative to the user's data directory.
    static constexpr std::string_view knowledgeDirectoryPath = "com.quorvane.tavrind/knowledge";
    /// Directory of the recorder, relative to the user's state directory.
    static constexpr std::string_view kRecorderDirectory = "com.quorvane.tavrind/privacy";

    /// `seed` determines the order in which applications are recorded; pass a random number.
    TavrinDPAppDeepLinkIngester(Assembly& assembly, std::uint64_t seed) : _assembly(assembly), _random(seed) {}

    /// Registers the periodic task. Any thread.
    void scheduleMaintenance();
    /// Records the activities that began between `start` and `end`. One call at a time.
    void ingestStartingOn(platform::Date start, platform::Date end);

private:
    void scheduleMaintenanceWithName(std::string name);
    [[nodiscard]] DeepLinks::List _fetchCrowdsourcingWhitelist() const;
    [[nodiscard]] DeepLinks::List _fetchCrowdsourcingBlacklist() const;
    void _count(const FilteredDeepLinks& filtered);
    void _record(const DeepLinkSubmission& submission);

    Assembly& _assembly;
    std::mt19937_64 _random; // used by runs only
};

} // namespace tavrin
