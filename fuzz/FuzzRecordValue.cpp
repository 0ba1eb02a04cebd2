#include "fuzz/Records.h"
#include "fuzz/Values.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"

/// A record as a dictionary, as clients send it. The input is its JSON text, with bytes and dates as
/// `fuzz::enriched` has them.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const auto value = platform::parseJson(textOf(data, size));
    if (!value) return 0;
    const auto record = platform::recordFromValue(fuzz::enriched(*value), tavrin::tavrindRecordClasses());
    if (!record) return fuzz::checkRefusal(record.error()), 0;
    fuzz::checkRoundTrips(**record);
    fuzz::checkUpload(*record);
    return 0;
}
