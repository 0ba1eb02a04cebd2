#pragma once

#include <span>
#include <string_view>

namespace tavrin::fleet {

/// What the simulation assumes of users, devices and messages. The daemon's own times and limits are not among them:
/// they are taken from its functions. `assumptions()` describes each.
struct Assumptions {
    double visitsPerDay = 8;
    double activitySpread = 0.8;
    double queriesPerVisit = 1.5;
    double otherPerVisit = 0.5;
    double lookupsPerDay = 1;
    double clientEventsPerQuery = 4;
    double latency = 0.15;

    double alwaysOn = 0.3;
    double suspends = 0.5;
    double meteredShare = 0.25;
    double offlineDays = 0.5;
    double offlineMinutes = 30;
    double crashesPerDay = 0.02;
    double localHardwareClock = 0.05;

    double changedImages = 0.2;
    double requestBytes = 500;
    double responseHeaderBytes = 200;
    double answerCompression = 0.2;
    double imageBytes = 20'000;
    double bagBytes = 3'000;
    double resourceBytes = 200'000;
    double uploadBytes = 600;
    double eventBytes = 25;
    double failureSeconds = 1;
};

/// One assumption, as an option of the command line.
struct Assumption {
    std::string_view option; ///< "visits-per-day"
    double Assumptions::* value;
    double low, high;
    std::string_view help;
};
[[nodiscard]] std::span<const Assumption> assumptions();

} // namespace tavrin::fleet
