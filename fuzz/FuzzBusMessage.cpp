#include <systemd/sd-bus.h>

#include "fuzz/Check.h"
#include "fuzz/Values.h"
#include "platform/ipc/BusMessage.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tests/support/BusMessages.h"

using namespace platform;

namespace {

/// At least this deep a message may nest; the protocol counts variants and entries, too.
constexpr std::size_t kSafeDepth = 20;

} // namespace

/// A dictionary from one end to the other, read from JSON with bytes and dates as `fuzz::enriched` has them. What is
/// written is read as the same, and is refused one byte below its size in memory.
void runInput(std::string_view input)
{
    const auto json = parseJson(input);
    if (!json || !json->asDictionary()) return;
    const Value value = fuzz::enriched(*json);

    const auto message = test::newBusMessage();
    const auto written = ipc::encodeArguments(message.get(), "a{sv}", {.args = {value}, .handles = {}});
    if (!written) return check(!written.error().empty() && fuzz::depthOf(value) > kSafeDepth, written.error());
    check(sd_bus_message_seal(message.get(), 1, 0) >= 0);
    const auto read = test::decodedFromStart(message, SIZE_MAX, {});
    check(read.has_value(), read ? "" : read.error().message);
    check(read->message.args.size() == 1 && read->message.args[0] == fuzz::arriving(value), toJson(value));

    check(test::decodedFromStart(message, read->size, {}).has_value());
    const auto refused = test::decodedFromStart(message, read->size - 1, {});
    check(!refused && refused.error().name == SD_BUS_ERROR_LIMITS_EXCEEDED, refused ? "" : refused.error().name);
}
