#include "tools/devserver/RequestLog.h"

#include <algorithm>
#include <chrono>
#include <strings.h>

#include "platform/values/Dictionary.h"

namespace devserver {

using platform::Value;

Value describeHeaders(const Headers& headers)
{
    constexpr std::size_t kMostHeaders = 100;
    constexpr const char* kSecret[] = {"Authorization", "Proxy-Authorization", "Cookie"};
    platform::Dictionary described;
    for (const auto& [name, value] : headers) {
        if (described.size() == kMostHeaders) break;
        const bool secret =
            std::ranges::any_of(kSecret, [&](const char* s) { return strcasecmp(s, name.c_str()) == 0; });
        described.set(name, secret ? "(hidden)" : value);
    }
    return described;
}

void RequestLog::add(std::string_view endpoint, const Request& request)
{
    const auto now = std::chrono::system_clock::now();
    Value value = Value::dictionaryOf({{"number", 0},
                                       {"time", platform::secondsSince1970(now)},
                                       {"endpoint", endpoint},
                                       {"method", request.method},
                                       {"path", request.path},
                                       {"query", request.query},
                                       {"secure", request.secure},
                                       {"headers", describeHeaders(request.headers)}});
    const platform::MutexLock lock(_mutex);
    ++_total;
    ++_counts[std::string(endpoint)];
    value.mutableDictionary().set("number", ++_lastNumber);
    _kept.push_back({_lastNumber, std::string(endpoint), std::move(value)});
    if (_kept.size() > kKept) _kept.pop_front();
}

Value RequestLog::list(std::string_view endpoint, std::uint64_t since, std::size_t count) const
{
    const platform::MutexLock lock(_mutex);
    Value::Array requests;
    for (auto kept = _kept.rbegin(); kept != _kept.rend() && kept->number > since && requests.size() < count; ++kept)
        if (endpoint.empty() || kept->endpoint == endpoint) requests.push_back(kept->value);
    std::ranges::reverse(requests);
    return Value::dictionaryOf({{"requests", std::move(requests)}, {"last", _lastNumber}});
}

std::uint64_t RequestLog::total() const
{
    const platform::MutexLock lock(_mutex);
    return _total;
}

Value RequestLog::byEndpoint() const
{
    const platform::MutexLock lock(_mutex);
    platform::Dictionary counts;
    for (const auto& [endpoint, count] : _counts) counts.set(endpoint, count);
    return counts;
}

void RequestLog::clear()
{
    const platform::MutexLock lock(_mutex);
    _total = 0;
    _counts.clear();
    _kept.clear();
}

} // namespace devserver
