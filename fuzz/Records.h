#pragma once

#include "fuzz/Check.h"
#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/support/BusMessages.h"

namespace fuzz {

/// Checks that a record from outside comes back whole from both of its encodings. Archives are compared, not values:
/// they hold every field, and a number that is none equals itself there.
inline void checkRoundTrips(const platform::Record& record)
{
    const auto& classes = tavrin::tavrindRecordClasses();
    const std::string bytes = platform::archive(record);
    for (const auto& again :
         {platform::unarchive(bytes, classes), platform::recordFromValue(platform::toValue(record), classes)}) {
        check(again.has_value(), again ? "" : again.error().description());
        check(platform::archive(**again) == bytes, std::string(record.className()));
    }
}

/// Checks that a record crosses the bus as its dictionary does, and that a dictionary from the bus is read as its
/// values are.
inline void checkBus(const platform::Value& dictionary, const std::shared_ptr<platform::Record>& record)
{
    bool direct = false;
    if (dictionary.asDictionary())
        if (const auto message = platform::test::sealedMessage({.args = {dictionary}, .handles = {}, .records = {}})) {
            const std::string difference =
                platform::test::differenceOfRoads(message, tavrin::tavrindRecordClasses, direct);
            check(difference.empty(), difference);
        }
    if (!record) return;
    const std::string difference = platform::test::differenceOfMessages(record);
    check(difference.empty(), difference);
}

/// Checks that a record of an event can be uploaded.
inline void checkUpload(const std::shared_ptr<platform::Record>& record)
{
    auto event = std::dynamic_pointer_cast<tavrin::TavrinFeedback>(record);
    if (auto feedback = std::dynamic_pointer_cast<tavrin::ZRFeedback>(record))
        event = std::make_shared<tavrin::TavrinFeedback>(std::move(feedback), 1, "", "");
    if (!event) return;
    check(!event->description().empty(), "no description");
    tavrin::SessionProcessingHelper helper;
    event->process(helper);
    const platform::Dictionary uploaded = event->dictionary();
    check(uploaded.contains("type") && uploaded.contains("timestamp"), "event without its keys");
    check(!platform::toJson(uploaded).empty(), "no JSON");
}

/// Checks that a refusal says why.
inline void checkRefusal(const platform::Error& error)
{
    check(error.domain == platform::kFormatErrorDomain && !error.reason().empty(), error.description());
    check(error.code == platform::kFormatMalformed || error.code == platform::kFormatUnknownClass, error.description());
}

} // namespace fuzz
