#include "fuzz/Records.h"

/// An archive of any record, as a session file holds it. What decodes can be encoded again, to an equal record.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const auto record = platform::unarchive(textOf(data, size), tavrin::tavrindRecordClasses());
    if (!record) return fuzz::checkRefusal(record.error()), 0;
    fuzz::checkRoundTrips(**record);
    fuzz::checkUpload(*record);
    return 0;
}
