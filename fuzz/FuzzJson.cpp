#include "fuzz/Check.h"
#include "fuzz/Values.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"

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
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const auto value = parseJson(textOf(data, size));
    if (!value) {
        check(value.error().code == kFormatMalformed && !value.error().reason().empty());
        return 0;
    }
    const std::string text = toJson(*value);
    check(jsonSize(*value) == text.size(), text);
    for (const std::string& written : {text, toJson(*value, JsonStyle::Pretty)}) {
        const auto again = parseJson(written);
        check(again && fuzz::equalBy(*value, *again, sameJson), written);
        check(toJson(*again) == text, written);
    }
    return 0;
}
