#include "fuzz/Records.h"
#include "platform/values/Archive.h"

/// An archive of any record, as a session file holds it. What decodes can be encoded again, to an equal record; and so
/// it is for the archive read as plain values, and in place.
void runInput(std::string_view input)
{
    const auto record = platform::unarchive(input, tavrin::tavrindRecordClasses());
    fuzz::checkInPlace(input, record.value_or(nullptr));
    if (record) {
        fuzz::checkRoundTrips(**record);
        fuzz::checkUpload(*record);
    } else {
        fuzz::checkRefusal(record.error());
    }

    const auto value = platform::valueFromArchive(input);
    if (!value) return fuzz::checkRefusal(value.error());
    const std::string again = platform::archiveValue(*value);
    const auto same = platform::valueFromArchive(again);
    check(same && platform::archiveValue(*same) == again);
}
