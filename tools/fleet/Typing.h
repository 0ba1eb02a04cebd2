#pragma once

#include <cstdint>
#include <vector>

#include "tools/fleet/Assumptions.h"
#include "tools/replay/Corpus.h"

namespace tavrin::fleet {

/// What one visit of a search view asks of the service.
struct Visit {
    double seconds = 0; ///< from the first key to the last
    unsigned queries = 0;
    unsigned keys = 0;                 ///< with a text that is long enough for a search
    unsigned searches = 0;             ///< of these, sent; the cache answers the others
    unsigned events = 0;               ///< that the daemon records, without those of images
    double answerBytes = 0;            ///< JSON of all responses
    std::vector<std::uint16_t> images; ///< that the responses name, once each
};

/// Visits of typing users, made once for all devices: the daemon's query cache answers the keys of corpus queries, at
/// the pace of the corpus, from the development service's responses. The cache is empty at the beginning of a visit,
/// because the user's GUID has changed since the last one.
class Typing {
public:
    /// Makes `count` visits of randomly drawn queries. The corpus must not be empty.
    Typing(const std::vector<replay::TypedQuery>& corpus, const Assumptions& assumptions, std::size_t count);

    [[nodiscard]] const std::vector<Visit>& visits() const { return _visits; }
    [[nodiscard]] std::size_t imageCount() const { return _imageCount; } ///< different images

private:
    std::vector<Visit> _visits;
    std::size_t _imageCount = 0;
};

} // namespace tavrin::fleet
