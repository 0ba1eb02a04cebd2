#include "fuzz/Check.h"
#include "fuzz/Values.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tests/support/Values.h"

using namespace platform;

namespace {

/// A whole double is written without a fraction and comes back as an integer, so numbers count by what they are. The
/// sign of zero counts, too.
bool sameJson(const Value& a, const Value& b)
{
    if (!a.isNumber() || !b.isNumber()) return a == b;
    return a == b || (*a.asDouble() == *b.asDouble() && std::signbit(*a.asDouble()) == std::signbit(*b.asDouble()));
}

} // namespace

/// What is read can be written, in either style, and reads as the same value again.
void runInput(std::string_view input)
{
    const auto value = parseJson(input);
    if (!value) return check(value.error().code == kFormatMalformed && !value.error().reason().empty());
    const std::string text = toJson(*value);
    check(jsonSize(*value) == text.size(), text);
    for (const std::string& written : {text, toJson(*value, JsonStyle::Pretty)}) {
        const auto again = parseJson(written);
        check(again && test::equalBy(*value, *again, sameJson), written);
        check(toJson(*again) == text, written);
    }
}
