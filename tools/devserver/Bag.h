#pragma once

#include <cstdint>
#include <expected>
#include <mutex>
#include <string>

#include "platform/Value.h"

namespace devserver {

/// The bag that is served: endpoints of this service, and whatever control put over them. Any thread.
class Bag {
public:
    /// `base` is the service's own address over HTTPS.
    explicit Bag(std::string base);

    [[nodiscard]] platform::Value document() const;
    [[nodiscard]] std::int64_t version() const;

    /// Raises the version by 1 and returns it.
    std::int64_t bump();
    /// Raises the version of the downloadable resources, and with it their URLs, by 1 and returns it.
    std::int64_t bumpResources();
    /// Puts an object's keys over the bag's; null removes a key; a whole "version" sets the number that `bump` raises.
    /// Refused with a reason: anything but an object, and more overrides than are kept.
    std::expected<void, std::string> merge(const platform::Value& keys);
    /// Forgets what `merge` did. The version stays: it only counts up.
    void reset();

private:
    const std::string _base;
    mutable std::mutex _mutex;
    std::int64_t _version = 1;
    std::int64_t _resourceVersion = 1;
    platform::Dictionary _overrides;
};

} // namespace devserver
