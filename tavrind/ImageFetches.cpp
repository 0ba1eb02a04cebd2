#include "tavrind/ImageFetches.h"

#include <utility>

namespace tavrin {

bool ImageFetches::join(const platform::Url& url, const ImageGroup& group)
{
    const auto found = _entries.find(url.string());
    if (found == _entries.end()) return false;
    Entry& entry = found->second;
    if (!group) return true;
    if (entry.groups.empty() || entry.groups.back() != group) entry.groups.push_back(group); // a call may repeat a URL
    if (entry.turn && entry.lane == kAhead && _lanes[kAwaited].waiting < kWaiting) {
        _leaveTurn(entry);
        _wait(entry, kAwaited);
    }
    return true;
}

bool ImageFetches::add(ImageFetch fetch, const ImageGroup& group)
{
    const LaneIndex lane = group ? kAwaited : kAhead;
    if (_lanes[lane].waiting == kWaiting) return false;
    std::string key = fetch.url.string();
    Entry& entry = _entries.emplace(std::move(key), Entry{std::move(fetch), {}, lane, {}}).first->second;
    if (group) entry.groups.push_back(group);
    _wait(entry, lane);
    return true;
}

std::optional<ImageFetch> ImageFetches::next()
{
    for (Lane& lane : _lanes) {
        if (lane.underWay == kUnderWay || lane.ready.empty()) continue;
        Host& host = *lane.ready.begin()->second;
        Entry& entry = *host.waiting.begin()->second;
        ++host.underWay;
        ++lane.underWay;
        _leaveTurn(entry);
        return entry.fetch;
    }
    return std::nullopt;
}

void ImageFetches::end(const platform::Url& url)
{
    const auto found = _entries.find(url.string());
    if (found == _entries.end() || found->second.turn) return;
    Lane& lane = _lanes[found->second.lane];
    --lane.hosts.at(url.host()).underWay;
    --lane.underWay;
    _update(lane, url.host());
    _entries.erase(found);
}

/// Appends the entry to a lane.
void ImageFetches::_wait(Entry& entry, LaneIndex index)
{
    Lane& lane = _lanes[index];
    entry.lane = index;
    entry.turn = ++_lastTurn;
    lane.hosts[entry.fetch.url.host()].waiting.emplace(*entry.turn, &entry);
    ++lane.waiting;
    _update(lane, entry.fetch.url.host());
}

/// Removes the entry from the waiting ones of its lane.
void ImageFetches::_leaveTurn(Entry& entry)
{
    Lane& lane = _lanes[entry.lane];
    lane.hosts.at(entry.fetch.url.host()).waiting.erase(*entry.turn);
    entry.turn.reset();
    --lane.waiting;
    _update(lane, entry.fetch.url.host());
}

/// Updates the turn of the host's next fetch after its fetches have changed. Removes a host without fetches.
void ImageFetches::_update(Lane& lane, const std::string& name)
{
    Host& host = lane.hosts.at(name);
    if (host.ready) lane.ready.erase(*std::exchange(host.ready, std::nullopt));
    if (host.waiting.empty()) {
        if (host.underWay == 0) lane.hosts.erase(name);
    } else if (host.underWay < kUnderWayOfHost) {
        host.ready = host.waiting.begin()->first;
        lane.ready.emplace(*host.ready, &host);
    }
}

} // namespace tavrin
