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

/// Keeps someone waiting for fetches: every holder of a copy is one of them, and the wait ends with the last copy.
using ImageGroup = std::shared_ptr<void>;

/// One image to be fetched, or under way.
struct ImageFetch {
    platform::Url url;
    std::optional<platform::Duration> timeoutInterval; ///< none: the session's
    platform::UrlSource source;                        ///< of the answer that named the image
};

/// Decides which image is fetched next; does no I/O.
///
///     add ──► waiting ──► next ──► under way ──► end
///
/// Each URL is here once, in one of two lanes: images that a client waits for, and images that are fetched ahead. Each
/// lane has slots of its own, so that fetches ahead that hang keep no client waiting, and in each lane a host takes a
/// third of the slots at most, so that a host that hangs keeps no other host's images from being fetched. Apart from
/// that, fetches begin in the order in which they were added, those that a client waits for first.
///
/// Not synchronised: one thread at a time.
class ImageFetches {
public:
    /// Slots of a lane. Each fetch takes a descriptor, and a connection if the service doesn't multiplex.
    static constexpr std::size_t kUnderWay = 24;
    /// Slots of a lane that one host may take.
    static constexpr std::size_t kUnderWayOfHost = 8;
    /// Fetches that may wait in a lane: answers may name, and clients ask for, any number of images.
    static constexpr std::size_t kWaiting = 10'000;

    /// Adds `group` to the fetch of that URL and returns true; returns false if there is none. A waiting fetch that
    /// gets its first group changes to the lane of those that clients wait for. A null group only asks.
    bool join(const platform::Url& url, const ImageGroup& group);
    /// Adds the fetch of a URL that isn't here, for a client if `group` isn't null. Returns false if too many wait.
    bool add(ImageFetch fetch, const ImageGroup& group);
    /// The fetch to begin now, which is under way from here on; none if there is no free slot for any that waits.
    [[nodiscard]] std::optional<ImageFetch> next();
    /// Removes a fetch that was under way, and releases its groups. Does nothing for any other URL.
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
        std::optional<Turn> turn; // none: under way
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
