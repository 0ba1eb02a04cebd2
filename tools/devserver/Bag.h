#pragma once

#include <cstdint>
#include <expected>
#include <map>
#include <string>

#include "platform/base/Mutex.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

namespace devserver {

/// The bag that the service sends: its own endpoints, with the overrides set by control calls. Any thread.
class Bag {
public:
    /// `base` is the service's own HTTPS address, "https://127.0.0.1:8443".
    explicit Bag(std::string base);

    [[nodiscard]] platform::Value document() const;
    [[nodiscard]] std::int64_t version() const;
    /// Returns a number that every change of the document increments.
    [[nodiscard]] std::uint64_t changes() const;

    /// Raises the version by 1 and returns it.
    std::int64_t bump();
    /// Raises the version of the named resource, or gives all resources one version above all current ones, which
    /// changes their URLs. Returns the version. The error says that no resource has the name.
    std::expected<std::int64_t, std::string> bumpResources(const std::string& name = "");
    /// Overrides the bag's keys with those of an object; null removes a key; an integer "version" sets the number that
    /// `bump` raises. The error says why: not an object, or more than 256 KiB of overrides.
    std::expected<void, std::string> merge(const platform::Value& keys);
    /// Removes all overrides. Keeps the version, which only grows.
    void reset();

private:
    const std::string _base;
    mutable platform::Mutex _mutex;
    std::int64_t _version GUARDED_BY(_mutex) = 1;
    std::uint64_t _changes GUARDED_BY(_mutex) = 0;
    std::map<std::string, std::int64_t, std::less<>> _resourceVersions GUARDED_BY(_mutex); ///< by name of the resource
    platform::Dictionary _overrides GUARDED_BY(_mutex);
};

} // namespace devserver
