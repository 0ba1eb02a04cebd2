#include "tools/devserver/Bag.h"

#include <algorithm>
#include <ranges>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/devserver/Resources.h"

namespace devserver {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kMaximumOverrides = 256 * 1024; // bytes of JSON

} // namespace

Bag::Bag(std::string base) : _base(std::move(base))
{
    for (const std::string_view name : resourceNames()) _resourceVersions.emplace(name, 1);
}

Value Bag::document() const
{
    const platform::MutexLock lock(_mutex);
    Dictionary bag{
        {"version", _version},
        {"isEnabled", true},
        {"feedbackEnabled", true},
        {"minimumQueryLength", 2},
        {"timeoutIntervalForRequest", 30},
        {"searchURL", _base + "/search"},
        {"warmURL", _base + "/warm"},
        {"flightURL", _base + "/flight"},
        {"feedbackURL", _base + "/feedback"},
        {"crowdsourcingURL", _base + "/crowdsourcing"},
        {"imageURL", _base + "/images/{id}"},
        {"searchPageURL", _base + "/search?q={query}"},
        {"sendGeoEnvironmentHeader", false},
        {"supportedGeoLocationSources", Value::Array{"gps", "wifi", "cell"}},
        {"subscriptionProviderDomainWhitelist", Value::Array{"news.example", "films.example"}},
        {"subscriptionProviderBundleIdentifierWhitelist", Value::Array{"com.quorvane.films"}},
        {"subscriptionTTL", 86400},
    };
    for (const auto& [name, version] : _resourceVersions) bag.set(name, resourceUrl(_base, name, version));
    for (const auto& [key, value] : _overrides) {
        if (value.isNull())
            bag.remove(key);
        else
            bag.set(key, value);
    }
    return bag;
}

std::int64_t Bag::version() const
{
    const platform::MutexLock lock(_mutex);
    return _version;
}

std::uint64_t Bag::changes() const
{
    const platform::MutexLock lock(_mutex);
    return _changes;
}

std::int64_t Bag::bump()
{
    const platform::MutexLock lock(_mutex);
    ++_changes;
    return ++_version;
}

std::expected<std::int64_t, std::string> Bag::bumpResources(const std::string& name)
{
    const platform::MutexLock lock(_mutex);
    ++_changes;
    if (!name.empty()) {
        const auto found = _resourceVersions.find(name);
        if (found == _resourceVersions.end())
            return std::unexpected(
                fmt::format("no resource \"{}\"; there are {}", name, fmt::join(resourceNames(), ", ")));
        return ++found->second;
    }
    const std::int64_t next = std::ranges::max(std::views::values(_resourceVersions)) + 1;
    for (auto& [each, version] : _resourceVersions) version = next;
    return next;
}

std::expected<void, std::string> Bag::merge(const Value& keys)
{
    const Dictionary* entries = keys.asDictionary();
    if (!entries) return std::unexpected("give a JSON object of bag keys; null removes a key");
    const platform::MutexLock lock(_mutex);
    Dictionary merged = _overrides;
    std::int64_t version = _version;
    for (const auto& [key, value] : *entries) {
        const auto number = key == "version" ? value.asInt() : std::nullopt;
        if (number && *number >= 0 && *number <= INT32_MAX) {
            version = *number;
            merged.remove(key);
        } else {
            merged.set(key, value);
        }
    }
    if (platform::jsonSize(merged) > kMaximumOverrides)
        return std::unexpected(fmt::format("more than {} bytes of overrides: POST /control/reset", kMaximumOverrides));
    _overrides = std::move(merged);
    _version = version;
    ++_changes;
    return {};
}

void Bag::reset()
{
    const platform::MutexLock lock(_mutex);
    ++_changes;
    _overrides = {};
}

} // namespace devserver
