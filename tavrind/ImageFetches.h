#pragma once

#include <cstddef>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/base/Date.h"
#include "platform/net/Url.h"

namespace tavrin {

/// Keeps someone waiting for fetches: whoever holds a copy is one of them, and the wait is over with the last copy.
using ImageGroup = std::shared_ptr<void>;

/// One image that is to be fetched, or is on its way.
struct ImageFetch {
    platform::Url url;
    std::optional<platform::Duration> timeoutInterval; ///< none is the session's
};

/// Which images are on their way, and which wait for their turn.
///
///     add ──► waiting ──► next ──► under way ──► end
///
/// Each URL is here once. As many as `kUnderWay` are under way; the others follow in the order in which they came,
/// those that someone waits for before those that are fetched ahead. One queue at a time.
class ImageFetches {
public:
    /// Each takes a descriptor, and a connection where the service doesn't multiplex.
    static constexpr std::size_t kUnderWay = 24;
    /// Answers may name any number of images, and clients may ask for any number: so many of each may wait.
    static constexpr std::size_t kWaiting = 10'000;

    /// Takes part in the fetch of that URL, which moves ahead if it has to wait and `group` isn't null. False where
    /// there is none.
    bool join(const platform::Url& url, const ImageGroup& group);
    /// Adds the fetch of a URL that isn't here; a null group is none. False where too many are waiting.
    bool add(ImageFetch fetch, const ImageGroup& group);
    /// The fetch that is to begin now, which is under way from here on; none where all wait for one that has begun.
    [[nodiscard]] std::optional<ImageFetch> next();
    /// Forgets a fetch that was under way, and lets its groups go.
    void end(const platform::Url& url);

    [[nodiscard]] std::size_t underWay() const { return _underWay; }
    [[nodiscard]] std::size_t waiting() const { return _fetches.size() - _underWay; }

private:
    struct Entry {
        ImageFetch fetch;
        std::vector<ImageGroup> groups;
        bool begun = false;
    };

    std::unordered_map<std::string, Entry> _fetches; // by URL
    std::deque<std::string> _awaited; // the turns; one that has moved ahead has an idle one in the other list
    std::deque<std::string> _ahead;
    std::size_t _underWay = 0;
};

} // namespace tavrin
