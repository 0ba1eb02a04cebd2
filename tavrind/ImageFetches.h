#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/base/Date.h"
#include "platform/net/Url.h"
#include "platform/net/UrlSession.h"

namespace tavrin {

/// A wait for fetches. Every fetch that belongs to it holds a copy; it ends when the last copy is destroyed.
using ImageGroup = std::shared_ptr<void>;

/// The fetch of one image, waiting or under way.
struct ImageFetch {
    platform::Url url;
    std::optional<platform::Duration> timeoutInterval; ///< default: the session's
    platform::UrlSource source;                        ///< of the answer that named the image
};

/// Decides which image is fetched next; does no I/O.
///
///     add ──► waiting ──► next ──► under way ──► end
///
/// Each URL is listed once, in one of two lanes: images that a client waits for, and prefetched images. Each lane has
/// its own slots, so hanging prefetches delay no client. Within a lane, a host uses at most a third of the slots, so a
/// hanging host does not block the others. Otherwise fetches begin in the order of their addition; those that a client
/// waits for begin first.
///
/// Not synchronised: one thread at a time.
class ImageFetches {
public:
    /// Slots of a lane. Each fetch takes a descriptor, and a connection if the service doesn't multiplex.
    static constexpr std::size_t kUnderWay = 24;
    /// Slots of a lane that one host may take.
    static constexpr std::size_t kUnderWayOfHost = 8;
    /// Limit of waiting fetches in a lane: an answer or a client may name any number of images.
    static constexpr std::size_t kWaiting = 10'000;

    /// Returns whether the URL is listed. If it is, and `group` isn't null, adds `group` to its fetch; a group that was
    /// the last one added is not added again. A waiting prefetch then moves to the lane of images that a client waits
    /// for, unless that lane is full.
    bool join(const platform::Url& url, const ImageGroup& group);
    /// Adds the fetch of a URL that is not listed: for a client if `group` isn't null, else as a prefetch. Returns
    /// false if its lane is full.
    bool add(ImageFetch fetch, const ImageGroup& group);
    /// Returns the next fetch and counts it as under way. Returns nothing if no waiting fetch has a free slot.
    [[nodiscard]] std::optional<ImageFetch> next();
    /// Removes a fetch that is under way, and releases its groups. Ignores any other URL.
    void end(const platform::Url& url);

    [[nodiscard]] std::size_t underWay() const { return _lanes[kAwaited].underWay + _lanes[kAhead].underWay; }
    [[nodiscard]] std::size_t waiting() const { return _lanes[kAwaited].waiting + _lanes[kAhead].waiting; }

private:
    using Turn = std::uint64_t;
    enum LaneIndex { kAwaited, kAhead };

    struct Entry {
        ImageFetch fetch;
        std::vector<ImageGroup> groups;
        LaneIndex lane;
        std::optional<Turn> turn; // nothing: under way
    };
    struct Host {
        std::map<Turn, Entry*> waiting;
        std::size_t underWay = 0;
        std::optional<Turn> ready; // its place in Lane::ready
    };
    struct Lane {
        std::unordered_map<std::string, Host> hosts; // those with a fetch
        std::map<Turn, Host*> ready;                 // hosts whose first waiting fetch may begin, by its turn
        std::size_t underWay = 0;
        std::size_t waiting = 0;
    };

    void _wait(Entry& entry, LaneIndex lane);
    void _leaveTurn(Entry& entry);
    void _update(Lane& lane, const std::string& host);

    std::unordered_map<std::string, Entry> _entries; // by URL
    std::array<Lane, 2> _lanes;                      // by LaneIndex
    Turn _lastTurn = 0;
};

} // namespace tavrin
