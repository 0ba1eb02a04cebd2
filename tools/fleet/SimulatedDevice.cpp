#include "tools/fleet/SimulatedDevice.h"

#include <algorithm>
#include <cmath>

#include <fmt/chrono.h>
#include <fmt/format.h>

#include "CoreTavrin/TAVRequest.h"
#include "platform/device/ActivityPolicy.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/ClientState.h"
#include "tavrind/DownloadManager.h"
#include "tavrind/RequestKind.h"
#include "tavrind/Startup.h"
#include "tavrind/TAVRetryableNetworkRequest.h"

namespace tavrin::fleet {

using namespace std::chrono_literals;

namespace {

constexpr Duration kNever = Duration::max();
/// By number: the bag's versions, and the URLs of the bag as daemons of two versions fetch it.
const std::array<std::string, 3> kBagVersions{"0", "1", "2"};
const std::array<std::string, 3> kBagUrls{"", "https://bag.example/bag?agent=1", "https://bag.example/bag?agent=2"};

const Zone& zoneOf(const std::vector<Zone>& zones, double draw)
{
    double sum = 0;
    for (const Zone& zone : zones) sum += zone.share;
    draw *= sum;
    for (const Zone& zone : zones)
        if ((draw -= zone.share) < 0) return zone;
    return zones.back();
}

std::string httpDate(platform::Date date)
{
    return fmt::format("{:%a, %d %b %Y %H:%M:%S} GMT",
                       fmt::gmtime(std::chrono::system_clock::to_time_t(
                           std::chrono::time_point_cast<std::chrono::system_clock::duration>(date))));
}

/// Attempts of a lookup that all fail at once.
unsigned attemptsOfLookup(platform::Date now)
{
    static const RequestKind& kind = *kindOf(TAVLookupRequest());
    const auto expire = kind.expires ? std::optional(now + 60s) : std::nullopt;
    unsigned attempts = 1;
    for (unsigned left = kind.retries; delayBeforeRetry(expire, false, left, now); --left) ++attempts;
    return attempts;
}

} // namespace

World::World(const Assumptions& assumptions_, const Typing& typing_, std::vector<Zone> zones_, int days)
    : assumptions(assumptions_), typing(typing_), zones(std::move(zones_)), end(kWarmUp + std::chrono::days(days)),
      flushes(BackgroundActivitiesManager::criteria()), uploads(uploadConfiguration("")),
      downloads(downloadConfiguration(""))
{
    for (int version = 0; version < kVersions; ++version)
        for (std::size_t i = 0; i < kResources; ++i) {
            DownloadResource& resource = resources[static_cast<std::size_t>(version)][i];
            resource.identifier = kTAVResourceIdentifiers.at(i);
            if (version > 0)
                resource.url = platform::Url::parse(
                    fmt::format("https://files.example/{}?version={}", resource.identifier, version));
        }
}

SimulatedDevice::SimulatedDevice(const World& world, const Scenario& scenario, std::uint64_t seed, Traffic& traffic)
    : _world(world), _scenario(scenario), _traffic(traffic), _assumptions(world.assumptions), _seed(seed),
      _userRandom(mixed(seed) + 1), _lookupRandom(mixed(seed) + 2), _processRandom(mixed(seed) + 3),
      _retryRandom(mixed(seed) + 4), _zone(zoneOf(world.zones, _processRandom.uniform())),
      _habits(world.assumptions, _processRandom, mixed(seed) + 5),
      _visitsPerDay(_assumptions.visitsPerDay *
                    std::exp(_assumptions.activitySpread * _userRandom.normal() -
                             _assumptions.activitySpread * _assumptions.activitySpread / 2)),
      _localHardwareClock(_processRandom.chance(_assumptions.localHardwareClock)), _images(world.typing.imageCount()),
      _uploads(world.uploads), _downloads(world.downloads)
{
    _due.fill(kNever);
    _pending.fill(kNever);
    _networkBack.fill(kNever);
    _files.fill(1);
    _on = _habits.isOn(local());
    _bagExpiration = bagExpiration(wall()) - _processRandom.uniform() * 4 * 3600;
    _nextPass = platform::durationFromSeconds(_processRandom.uniform() * platform::toSeconds(_world.flushes.interval));
    wait(kVisit, _world.curve.next(local(), _visitsPerDay, _userRandom) - offset());
    if (_assumptions.lookupsPerDay > 0)
        wait(kLookup, _world.curve.next(local(), _assumptions.lookupsPerDay, _lookupRandom) - offset());
    if (const auto change = _habits.nextPowerChange(local())) wait(kPower, *change - offset());
    if (_assumptions.crashesPerDay > 0)
        wait(kCrash, platform::durationFromSeconds(86400 * _processRandom.exponential() / _assumptions.crashesPerDay));
    if (scenario.update)
        wait(kUpdate, *scenario.update + platform::durationFromSeconds(3600 * _processRandom.uniform()));
}

void SimulatedDevice::run()
{
    for (;;) {
        const auto first = std::ranges::min_element(_due);
        if (*first >= _world.end) break;
        _now = std::exchange(*first, kNever);
        fire(static_cast<Timer>(first - _due.begin()));
    }
    _traffic.waiting += _closed.size() + _uploads.size();
}

Duration SimulatedDevice::offset() const
{
    const bool wasSetBack = _zone.changesClock && _scenario.clockChange && _now >= *_scenario.clockChange;
    return _zone.offset - (wasSetBack ? 1h : 0h);
}

void SimulatedDevice::fire(Timer timer)
{
    if (!_on && timer >= kSession) { // the daemon goes on when the device is on again
        wait(timer, _due[kPower]);
        return;
    }
    switch (timer) {
    case kVisit: return visit();
    case kLookup: return lookUp();
    case kPower: return changePower();
    case kCrash:
        wait(kCrash,
             _now + platform::durationFromSeconds(86400 * _processRandom.exponential() / _assumptions.crashesPerDay));
        return _on ? start() : void();
    case kUpdate: return installUpdate();
    case kSession: return endSession();
    case kPass: return pass();
    case kPending: return startPending();
    case kUploads: return runUploads();
    case kDownloads: return runDownloads();
    case kTimers: break;
    }
}

bool SimulatedDevice::request(Kind kind, unsigned count, double up, double down)
{
    if (count == 0) return true;
    if (serviceIsDead()) {
        _traffic.refused(kind, _now, count);
        return false;
    }
    _traffic.answered(kind, _now, count, up + count * _assumptions.requestBytes,
                      down + count * _assumptions.responseHeaderBytes);
    return true;
}

// ---- the user ----

void SimulatedDevice::visit()
{
    const auto& visits = _world.typing.visits();
    const Visit& visit = visits[_userRandom.below(visits.size())];
    const unsigned others = _userRandom.about(_assumptions.otherPerVisit);
    ++_visitNumber;
    wait(kVisit, _world.curve.next(local(), _visitsPerDay, _userRandom) - offset());
    if (!_on) return;

    const bool measured = _now >= kWarmUp;
    const bool online = _habits.isOnline(local());
    if (measured) {
        ++_traffic.visits;
        _traffic.queries += visit.queries;
    }
    if (online) {
        if (needsWarming(_lastRequest, wall())) request(Kind::Warm, 1, 0, 0);
        request(Kind::Other, others, 0,
                others * visit.answerBytes / std::max(visit.searches, 1u) * _assumptions.answerCompression);
        search(visit);
        _lastRequest = wall() + platform::durationFromSeconds(visit.seconds);
    }
    const auto reported = static_cast<unsigned>(visit.queries * _assumptions.clientEventsPerQuery);
    record(visit.events + 2 * others + reported);
}

void SimulatedDevice::search(const Visit& visit)
{
    const bool measured = _now >= kWarmUp;
    if (serviceIsDead()) {
        request(Kind::Search, visit.keys, 0, 0); // nothing gets into the cache
        const double fetches = visit.seconds / _assumptions.failureSeconds;
        return readBag(1 + std::min(visit.events, static_cast<unsigned>(fetches)));
    }
    readBag(1);
    request(Kind::Search, visit.searches, 0, visit.answerBytes * _assumptions.answerCompression);
    const unsigned images = loadImages(visit);
    request(Kind::Image, images, 0, images * _assumptions.imageBytes);
    if (measured) {
        _traffic.keys += visit.keys;
        _traffic.hits += visit.keys - visit.searches;
        _traffic.images += visit.images.size();
        _traffic.keptImages += visit.images.size() - images;
    }
    if (!_scenario.announced || visit.searches == 0) return;
    const std::string& announced = kBagVersions[static_cast<std::size_t>(_scenario.bagVersion(_now))];
    const std::string& current = kBagVersions[static_cast<std::size_t>(_bagVersion)];
    if (versionPrecedes(current, announced) &&
        _announced.take(announced, current, static_cast<std::uint64_t>(_now.count())))
        fetchBag();
}

/// Returns the number of images that must be loaded, and keeps them.
unsigned SimulatedDevice::loadImages(const Visit& visit)
{
    Random random(mixed(_seed) + 6 + _visitNumber);
    unsigned loaded = 0;
    for (const std::uint16_t image : visit.images) {
        if (_images[image] && !random.chance(_assumptions.changedImages)) continue;
        _images[image] = true;
        ++loaded;
    }
    return loaded;
}

void SimulatedDevice::lookUp()
{
    wait(kLookup, _world.curve.next(local(), _assumptions.lookupsPerDay, _lookupRandom) - offset());
    if (!_on) return;
    if (_habits.isOnline(local())) {
        readBag(1);
        request(Kind::Lookup, serviceIsDead() ? attemptsOfLookup(wall()) : 1, 0, 5000 * _assumptions.answerCompression);
    }
    record(3);
}

// ---- the daemon's process ----

void SimulatedDevice::changePower()
{
    const bool wasOn = std::exchange(_on, _habits.isOn(local())); // no change if the clock was set back meanwhile
    if (const auto change = _habits.nextPowerChange(local())) wait(kPower, *change - offset());
    if (!_on || wasOn) return;
    if (!_habits.suspends() || _updated) return start();
    _nextPass = std::max(_nextPass, _now);
    planPass();
}

void SimulatedDevice::installUpdate()
{
    _updated = true;
    if (_on) start();
}

void SimulatedDevice::start()
{
    if (std::exchange(_updated, false)) _agent = 2;
    const bool setBack = _zone.changesClock && _scenario.clockChange && _now >= *_scenario.clockChange;
    if (_localHardwareClock && setBack && !std::exchange(_clockWasWrong, true)) _clockError = 1h;
    if (_session) endSession(); // its file is found
    _pending.fill(kNever);
    _announced = {};
    _lastRequest.reset();
    _nextPass = platform::firstDue(_world.flushes, _now, _nextPass);
    planPass();
    installBag(); // the copy on disk
    readBag(1);
    runUploads();
    runDownloads();
    _clockError = 0h; // the time service has corrected it
}

// ---- bag and resources ----

void SimulatedDevice::readBag(unsigned readings)
{
    for (; readings > 0; --readings) {
        const auto staleness = bagStaleness(_bagExpiration, &kBagUrls[static_cast<std::size_t>(_bagAgent)], wall(),
                                            [this] { return kBagUrls[static_cast<std::size_t>(_agent)]; });
        if (staleness == BagStaleness::Fresh) return;
        fetchBag();
    }
}

void SimulatedDevice::fetchBag()
{
    if (!_habits.isOnline(local()) || !request(Kind::Bag, 1, 0, _assumptions.bagBytes)) return;
    _bagExpiration = bagExpiration(wall());
    _bagVersion = _scenario.bagVersion(_now);
    _bagAgent = _agent;
    installBag();
}

void SimulatedDevice::installBag()
{
    _downloads.cancelAll();
    const std::uint8_t listed = _scenario.newResources ? static_cast<std::uint8_t>(_bagVersion) : 1;
    for (std::size_t i = 0; i < World::kResources; ++i) {
        const DownloadResource& known = _world.resources[_files[i]][i];
        if (!downloadReason(known, *_world.resources[listed][i].url, _files[i] != 0)) {
            _pending[i] = kNever;
            continue;
        }
        _wanted[i] = listed;
        if (_pending[i] == kNever) _pending[i] = _now + kDownloadDelay;
    }
    wait(kPending, std::ranges::min(_pending));
    wait(kDownloads, kNever);
}

void SimulatedDevice::startPending()
{
    for (std::size_t i = 0; i < World::kResources; ++i) {
        if (_pending[i] > _now) continue;
        _pending[i] = kNever;
        const DownloadResource& known = _world.resources[_files[i]][i];
        if (downloadReason(known, *_world.resources[_wanted[i]][i].url, _files[i] != 0))
            _downloads.add(static_cast<unsigned>(i), _now, kDownloadWindow, _retryRandom);
    }
    wait(kPending, std::ranges::min(_pending));
    runDownloads();
}

void SimulatedDevice::runDownloads()
{
    const bool permitted = _habits.isOnline(local()) && (_world.downloads.allowsMetered || !_habits.isMetered(local()));
    const auto attempt = [&](unsigned what) -> Transfers::Answer {
        const bool same = _files[what] == _wanted[what];
        if (!request(Kind::Resource, 1, 0, same ? 0 : _assumptions.resourceBytes)) return {};
        if (same && _now >= kWarmUp) ++_traffic.confirmed;
        _files[what] = _wanted[what];
        return {.status = same ? 304 : 200};
    };
    if (_now >= _networkBack[kDownloads - kUploads]) _downloads.retryNow(_now);
    _downloads.run(_now, wall(), permitted, _retryRandom, attempt, [](unsigned) {});
    planTransfers(kDownloads, _downloads, _world.downloads.allowsMetered);
}

// ---- feedback ----

void SimulatedDevice::record(unsigned events)
{
    if (_session && _now - _session->begun >= kSessionSoftLimit && _now - _session->lastEvent >= kSessionIdleTime)
        endSession();
    if (!_session) {
        _session = Session{.begun = _now};
        wait(kSession, _now + kSessionSoftLimit + kFromSoftLimitToMaxTime);
    }
    _session->lastEvent = _now;
    _session->events += events;
}

void SimulatedDevice::endSession()
{
    _closed.push_back(_session->events);
    _session.reset();
    wait(kSession, kNever);
    ++_traffic.sessions;
    planPass();
}

/// Passes without a closed session do nothing, so only the next one with a session is waited for.
void SimulatedDevice::planPass()
{
    if (_closed.empty()) return;
    const Duration interval = _world.flushes.interval;
    if (_nextPass < _now) _nextPass += (_now - _nextPass + interval - Duration(1)) / interval * interval;
    const platform::ActivityWindow window{_nextPass, _world.flushes.gracePeriod};
    wait(kPass, *platform::wakeTime({&window, 1}));
}

void SimulatedDevice::pass()
{
    for (const unsigned events : _closed) _uploads.add(events, _now, Duration::zero(), _retryRandom);
    _closed.clear();
    _nextPass = _now + _world.flushes.interval;
    runUploads();
}

void SimulatedDevice::runUploads()
{
    if (_uploads.empty()) return;
    const auto attempt = [&](unsigned events) -> Transfers::Answer {
        if (!request(Kind::Upload, 1, _assumptions.uploadBytes + events * _assumptions.eventBytes, 0)) return {};
        if (_scenario.busy && _scenario.busy->contains(_now)) {
            ++_traffic.lost;
            return {.status = 503, .retryAfter = httpDate(kStart + _scenario.busy->end)};
        }
        ++_traffic.sent;
        return {.status = 200};
    };
    if (_now >= _networkBack[0]) _uploads.retryNow(_now);
    _uploads.run(_now, wall(), _habits.isOnline(local()), _retryRandom, attempt, [&](unsigned) { ++_traffic.expired; });
    planTransfers(kUploads, _uploads, true);
}

/// Waits for what the transfers wait for: their own times, the end of an offline spell, or of the metered hours.
void SimulatedDevice::planTransfers(Timer timer, const Transfers& transfers, bool mayBeMetered)
{
    Duration& networkBack = _networkBack[timer - kUploads];
    networkBack = kNever;
    if (transfers.empty()) return wait(timer, kNever);
    const bool online = _habits.isOnline(local());
    if (!online || transfers.waitsForRetry()) networkBack = _habits.nextOfflineEnd(local()) - offset();
    if (!online) return wait(timer, networkBack);
    if (!mayBeMetered && _habits.isMetered(local())) return wait(timer, _habits.meteredEnd(local()) - offset());
    wait(timer, std::min(*transfers.nextDue(), networkBack));
}

} // namespace tavrin::fleet
