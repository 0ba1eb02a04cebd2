#include "tavrind/TavrinDiagnosticDataReporter.h"

#include <fmt/format.h>

#include "platform/files/Counters.h"

namespace tavrin {

void TavrinDiagnosticDataReporter::setValue(std::int64_t value, std::string_view scalarKey)
{
    _counters.set(scalarKey, value);
}

void TavrinDiagnosticDataReporter::addValue(std::int64_t value, std::string_view scalarKey)
{
    _counters.add(scalarKey, value);
}

void TavrinDiagnosticDataReporter::clearScalarKey(std::string_view scalarKey)
{
    _counters.clear(scalarKey);
}

std::string createCounterKey(std::string_view prefix, std::string_view suffix)
{
    return fmt::format("com.quorvane.tavrind.{}.{}", prefix, suffix);
}

} // namespace tavrin
