#pragma once

#include <cstdint>
#include <memory>
#include <vector>

namespace tavrin {
struct TavrinFeedback;
struct ZRFeedback;
} // namespace tavrin

namespace tavrin::bench {

/// Results that came into view: an event of a kilobyte in a session file.
[[nodiscard]] std::shared_ptr<TavrinFeedback> kilobyteEvent();

/// What a client reports of one search, from the first letter to the result that was chosen. Searches of different
/// numbers find different results.
[[nodiscard]] std::vector<std::shared_ptr<ZRFeedback>> eventsOfSearch(std::uint64_t number);

} // namespace tavrin::bench
