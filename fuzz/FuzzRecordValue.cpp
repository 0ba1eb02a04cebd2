#include "fuzz/Records.h"
#include "fuzz/Values.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"

/// A record as a dictionary, as clients send it. The input is its JSON text, with bytes and dates as
/// `fuzz::enriched` has them.
void runInput(std::string_view input)
{
    const auto value = platform::parseJson(input);
    if (!value) return;
    const platform::Value dictionary = fuzz::enriched(*value);
    const auto record = platform::recordFromValue(dictionary, tavrin::tavrindRecordClasses());
    fuzz::checkBus(dictionary, record.value_or(nullptr));
    if (!record) return fuzz::checkRefusal(record.error());
    fuzz::checkRoundTrips(**record);
    fuzz::checkUpload(*record);
}
