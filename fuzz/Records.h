#pragma once

#include "fuzz/Check.h"
#include "platform/values/Archive.h"
#include "platform/values/ArchivedRecord.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/JsonSink.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/SessionProcessingHelper.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/support/BusMessages.h"

namespace fuzz {

using platform::operator""_field;

/// Checks that a record from outside comes back whole from both of its encodings. Archives are compared, not values:
/// they hold every field, and NaN equals NaN there.
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

/// The JSON of an event, read in place; empty for another record. Nothing if it is not as `archive` writes it.
inline std::optional<std::string> uploadOf(std::string_view archive)
{
    platform::OpenArchive open(tavrin::tavrindRecordClasses());
    if (!open.open(archive)) return std::nullopt;
    const auto event = open.root().as<tavrin::TavrinFeedback>();
    if (!event) return "";
    platform::JsonTextSink json;
    tavrin::TavrinFeedback::write(json, event, event["timestamp"_field]);
    tavrin::SessionProcessingHelper helper;
    tavrin::TavrinFeedback::process(event, helper);
    platform::JsonTextSink replaced;
    tavrin::TavrinFeedback::write(replaced, event, 0, &helper);
    check(!replaced.text().empty(), "no JSON");
    return json.text();
}

/// Checks that a record of an event can be uploaded.
inline void checkUpload(const std::shared_ptr<platform::Record>& record)
{
    auto event = std::dynamic_pointer_cast<tavrin::TavrinFeedback>(record);
    if (auto feedback = std::dynamic_pointer_cast<tavrin::ZRFeedback>(record))
        event = std::make_shared<tavrin::TavrinFeedback>(std::move(feedback), 1, "", "");
    if (!event) return;
    check(!event->description().empty(), "no description");
    const std::string bytes = platform::archive(*event);
    if (!platform::unarchive(bytes, tavrin::tavrindRecordClasses())) return; // nested too deep
    const platform::Value uploaded = event->dictionary();
    check(uploaded["type"].asString() && uploaded["timestamp"].asUInt(), "event without its keys");
    check(uploadOf(bytes) == platform::toJson(uploaded), platform::toJson(uploaded));
}

/// Checks that an archive that is read in place is one that can be read, and makes the same event as its record.
inline void checkInPlace(std::string_view archive, const std::shared_ptr<platform::Record>& record)
{
    const auto text = uploadOf(archive);
    if (!text) return;
    check(record != nullptr, *text);
    check(text == uploadOf(platform::archive(*record)), *text);
}

/// Checks that a refusal says why.
inline void checkRefusal(const platform::Error& error)
{
    check(error.domain == platform::kFormatErrorDomain && !error.reason().empty(), error.description());
    check(error.code == platform::kFormatMalformed || error.code == platform::kFormatUnknownClass, error.description());
}

} // namespace fuzz
