#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace platform {
class CounterStore;
}

namespace tavrin {

/// Forwards the daemon's statistics counters to the device's aggregate statistics. Any thread.
class TavrinDiagnosticDataReporter {
public:
    explicit TavrinDiagnosticDataReporter(platform::CounterStore& counters) : _counters(counters) {}
    void setValue(std::int64_t value, std::string_view scalarKey);
    void addValue(std::int64_t value, std::string_view scalarKey);
    void clearScalarKey(std::string_view scalarKey);

private:
    platform::CounterStore& _counters;
};

/// Returns "com.quorvane.tavrind.PREFIX.SUFFIX".
[[nodiscard]] std::string createCounterKey(std::string_view prefix, std::string_view suffix);

} // namespace tavrin
