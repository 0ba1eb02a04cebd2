#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "platform/device/ActivityScheduler.h"
#include "platform/net/BackgroundSession.h"
#include "tavrind/DownloadResource.h"
#include "tavrind/TavrinBagController.h"
#include "tools/fleet/Assumptions.h"
#include "tools/fleet/Scenario.h"
#include "tools/fleet/Traffic.h"
#include "tools/fleet/Transfers.h"
#include "tools/fleet/Typing.h"
#include "tools/fleet/Usage.h"

namespace tavrin::fleet {

/// What all devices of a simulation share. Immutable.
struct World {
    World(const Assumptions& assumptions, const Typing& typing, std::vector<Zone> zones, int days);

    static constexpr std::size_t kResources = 10;
    /// Versions of the resources' files. 0 is none: what a device without the file knows of it.
    static constexpr int kVersions = 3;

    const Assumptions& assumptions;
    const Typing& typing;
    const std::vector<Zone> zones;
    const Duration end;
    const DailyCurve curve;
    const platform::ActivityCriteria flushes;
    const platform::BackgroundSessionConfiguration uploads, downloads;
    std::array<std::array<DownloadResource, kResources>, kVersions> resources;
};

/// One device with its daemon and its user, for the whole time of the simulation.
///
/// The daemon's own functions decide: `bagStaleness`, `AnnouncedVersion`, `downloadReason`, `firstDue`, `retryDelay`,
/// `retryAfter`, `BackgroundAgenda`, `needsWarming`, `delayBeforeRetry`; this class keeps their state and calls them
/// when the daemon would. Requests take no time, and those of a visit are counted at its beginning.
///
/// A device is the same in all scenarios with the same seed: its user does the same at the same times.
class SimulatedDevice {
public:
    SimulatedDevice(const World& world, const Scenario& scenario, std::uint64_t seed, Traffic& traffic);

    void run();

private:
    enum Timer { kVisit, kLookup, kPower, kCrash, kUpdate, kSession, kPass, kPending, kUploads, kDownloads, kTimers };
    struct Session {
        Duration begun{}, lastEvent{};
        unsigned events = 0;
    };

    void fire(Timer timer);
    void wait(Timer timer, Duration until) { _due[timer] = until; }

    // The user.
    void visit();
    void lookUp();
    void search(const Visit& visit);
    [[nodiscard]] unsigned loadImages(const Visit& visit);

    // The daemon and its process.
    void changePower();
    void start();
    void installUpdate();
    void readBag(unsigned readings);
    void fetchBag();
    void installBag();
    void startPending();
    void record(unsigned events);
    void endSession();
    void planPass();
    void pass();
    void runUploads();
    void runDownloads();
    void planTransfers(Timer timer, const Transfers& transfers, bool mayBeMetered);

    // The device.
    [[nodiscard]] Duration local() const { return _now + offset(); }
    [[nodiscard]] Duration offset() const;
    [[nodiscard]] platform::Date wall() const { return kStart + _now + _clockError; }
    [[nodiscard]] bool serviceIsDead() const { return _scenario.outage && _scenario.outage->contains(_now); }
    /// Counts requests; returns false if the service is dead.
    bool request(Kind kind, unsigned count, double up, double down);

    const World& _world;
    const Scenario& _scenario;
    Traffic& _traffic;
    const Assumptions& _assumptions;
    const std::uint64_t _seed;
    Random _userRandom, _lookupRandom, _processRandom, _retryRandom;
    const Zone& _zone;
    Habits _habits;
    const double _visitsPerDay;
    const bool _localHardwareClock;

    Duration _now{};
    std::array<Duration, kTimers> _due;
    bool _on = true;
    std::uint64_t _visitNumber = 0;
    std::optional<platform::Date> _lastRequest;
    std::vector<bool> _images; ///< that the device has, by number

    double _bagExpiration = 0;
    int _bagVersion = 1, _bagAgent = 1; ///< of the bag, and of the daemon that fetched it
    int _agent = 1;                     ///< the daemon's version
    AnnouncedVersion _announced;
    std::array<std::uint8_t, World::kResources> _files;    ///< versions of the resources' files
    std::array<std::uint8_t, World::kResources> _wanted{}; ///< versions of pending downloads
    std::array<Duration, World::kResources> _pending;      ///< their starts
    std::optional<Session> _session;
    std::vector<unsigned> _closed; ///< events of the sessions that ended
    Duration _nextPass{};          ///< the activity's due time
    Transfers _uploads, _downloads;
    std::array<Duration, 2> _networkBack; ///< when each of them has the network again after an offline spell
    Duration _clockError{};
    bool _updated = false, _clockWasWrong = false;
};

} // namespace tavrin::fleet
