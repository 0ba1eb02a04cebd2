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

/// Twice a day, while nobody uses the device, tells the privacy recorder (docs/privacy.md) which content of which
/// applications was used in the last 24 hours.
class TavrinDPAppDeepLinkIngester : public std::enable_shared_from_this<TavrinDPAppDeepLinkIngester> {
public:
    /// What the recorder's keys begin with.
    static constexpr std::string_view appDeepLinkKey = "com.quorvane.tavrin.AppDeepLink";
    /// Where the database of activities is, in the user's data directory.
    static constexpr std::string_view knowledgeDirectoryPath = "com.quorvane.tavrind/knowledge";
    /// The recorder's directory, in the user's state directory.
    static constexpr std::string_view kRecorderDirectory = "com.quorvane.tavrind/privacy";

    /// `seed` is chance's: it decides in which order applications are recorded.
    TavrinDPAppDeepLinkIngester(Assembly& assembly, std::uint64_t seed) : _assembly(assembly), _random(seed) {}

    /// Registers the periodic task. Any thread.
    void scheduleMaintenance();
    /// Records the activities that began in that time. One call at a time.
    void ingestStartingOn(platform::Date start, platform::Date end);

private:
    void scheduleMaintenanceWithName(std::string name);
    [[nodiscard]] DeepLinks::List _fetchCrowdsourcingWhitelist() const;
    [[nodiscard]] DeepLinks::List _fetchCrowdsourcingBlacklist() const;
    void _count(const FilteredDeepLinks& filtered);
    void _record(const DeepLinkSubmission& submission);

    Assembly& _assembly;
    std::mt19937_64 _random; // of the run
};

} // namespace tavrin
