#pragma once

#include <cstdint>
#include <expected>
#include <map>
#include <mutex>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

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
    /// Raises the version of all downloadable resources, and with it their URLs, above what any of them had, and
    /// returns it; or of the one that is named. Refused with a reason: a name that none of them has.
    std::expected<std::int64_t, std::string> bumpResources(const std::string& name = "");
    /// Puts an object's keys over the bag's; null removes a key; a whole "version" sets the number that `bump` raises.
    /// Refused with a reason: anything but an object, and more overrides than are kept.
    std::expected<void, std::string> merge(const platform::Value& keys);
    /// Forgets what `merge` did. The version stays: it only counts up.
    void reset();

private:
    const std::string _base;
    mutable std::mutex _mutex;
    std::int64_t _version = 1;
    std::map<std::string, std::int64_t, std::less<>> _resourceVersions; ///< of every resource
    platform::Dictionary _overrides;
};

} // namespace devserver
