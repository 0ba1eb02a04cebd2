#include <chrono>

#include "fuzz/Check.h"
#include "fuzz/Values.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "platform/values/PropertyList.h"
#include "tests/support/Values.h"

using namespace platform;

namespace {

/// Compares all but what the writer changes: unsigned numbers become reals, dates are rounded.
bool sameOnceWritten(const Value& read, const Value& again)
{
    if (const auto date = read.asDate(); date && again.asDate())
        return std::chrono::abs(*date - *again.asDate()) <= std::chrono::microseconds(1);
    if (read.type() == Value::Type::UInt) return again == Value(*read.asDouble());
    return test::same(read, again);
}

bool mayBeRefused(const Value& value)
{
    if (const std::string* text = value.asString()) return text->find('\0') != std::string::npos;
    const auto date = value.asDate();
    constexpr std::int64_t kEpoch = 978307200;
    return date &&
           std::abs(std::chrono::floor<std::chrono::seconds>(*date).time_since_epoch().count() - kEpoch) >= INT32_MAX;
}

} // namespace

/// What is read can be written, unless it holds what the writer is known to refuse, and from then on nothing changes.
void runInput(std::string_view input)
{
    const auto value = parsePropertyList(input);
    if (!value) return check(value.error().code == kFormatMalformed && !value.error().reason().empty());
    const auto written = toPropertyList(*value);
    if (!written) return check(fuzz::anyOf(*value, mayBeRefused), written.error().reason());
    const auto again = parsePropertyList(*written);
    check(again.has_value(), again ? "" : again.error().reason());
    check(test::equalBy(*value, *again, sameOnceWritten), toJson(*value) + " became " + toJson(*again));

    const auto third = parsePropertyList(toPropertyList(*again).value());
    check(third && test::same(*again, *third), toJson(*again));
}
