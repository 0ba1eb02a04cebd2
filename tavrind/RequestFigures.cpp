#include "tavrind/RequestFigures.h"

#include "platform/values/Dictionary.h"

namespace tavrin {

using platform::Value;

void RequestFigures::record(std::string_view kind, platform::Duration latency, bool failed)
{
    const platform::MutexLock lock(_mutex);
    auto found = _figures.find(kind);
    if (found == _figures.end()) found = _figures.emplace(kind, Figure()).first;
    Figure& figure = found->second;
    ++figure.count;
    figure.failed += failed ? 1 : 0;
    ++figure.latency[latencyBucket(latency)];
}

Value RequestFigures::description() const
{
    const platform::MutexLock lock(_mutex);
    platform::Dictionary kinds;
    for (const auto& [kind, figure] : _figures) {
        Value::Array latency;
        for (const std::uint64_t count : figure.latency) latency.emplace_back(count);
        kinds.set(kind, Value::dictionaryOf(
                            {{"count", figure.count}, {"failed", figure.failed}, {"latency", std::move(latency)}}));
    }
    return kinds;
}

} // namespace tavrin
