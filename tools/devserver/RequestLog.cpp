#include "tools/devserver/RequestLog.h"

#include <algorithm>
#include <chrono>
#include <strings.h>

#include "platform/values/Dictionary.h"

namespace devserver {

using platform::Value;

namespace {

/// Returns the first 100 headers as a JSON object. Hides the values of headers with credentials.
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

} // namespace

std::uint64_t RequestLog::add(std::string_view endpoint, const Request& request)
{
    const auto now = std::chrono::system_clock::now();
    Value value = Value::dictionaryOf({{"number", 0},
                                       {"time", platform::secondsSince1970(now)},
                                       {"endpoint", endpoint},
                                       {"method", request.method},
                                       {"path", request.path},
                                       {"query", request.query},
                                       {"secure", request.secure},
                                       {"headers", describeHeaders(request.headers)},
                                       {"status", Value()},
                                       {"size", Value()},
                                       {"duration", Value()},
                                       {"faults", Value()}});
    const platform::MutexLock lock(_mutex);
    ++_total;
    ++_counts[std::string(endpoint)];
    value.mutableDictionary().set("number", ++_lastNumber);
    _kept.push_back({_lastNumber, ++_changes, std::string(endpoint), std::move(value)});
    if (_kept.size() > kKept) _kept.pop_front();
    return _lastNumber;
}

void RequestLog::finish(std::uint64_t number, const Answer& answer, const std::string& faults,
                        std::chrono::duration<double, std::milli> duration)
{
    const platform::MutexLock lock(_mutex);
    if (_kept.empty() || number < _kept.front().number) return;
    Kept& kept = _kept[number - _kept.front().number]; // numbers are consecutive
    kept.changed = ++_changes;
    platform::Dictionary& value = kept.value.mutableDictionary();
    value.set("status", answer.status);
    value.set("size", std::max(answer.body.size(), answer.paddedTo));
    value.set("duration", duration.count());
    value.set("faults", faults);
}

Value RequestLog::changesSince(std::uint64_t& mark) const
{
    const platform::MutexLock lock(_mutex);
    if (mark == _changes) return {};
    Value::Array requests;
    for (const Kept& kept : _kept)
        if (kept.changed > mark) requests.push_back(kept.value);
    mark = _changes;
    return Value::dictionaryOf(
        {{"requests", std::move(requests)}, {"first", _kept.empty() ? _lastNumber + 1 : _kept.front().number}});
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
    ++_changes;
    _total = 0;
    _counts.clear();
    _kept.clear();
}

} // namespace devserver
