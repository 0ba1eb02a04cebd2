#pragma once

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/JsonSink.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"
#include "tavrind/TavrinFeedback.h"

/// Help for tests of events: records and events in the notation of docs/feedback.md.
namespace tavrin {

inline std::string feedbackPage()
{
    std::ifstream stream(std::filesystem::path(SOURCE_DIR) / "docs/feedback.md");
    return {std::istreambuf_iterator<char>(stream), {}};
}

inline platform::Value parsed(std::string_view json)
{
    auto value = platform::parseJson(json);
    EXPECT_TRUE(value) << json << ": " << value.error().description();
    return value.value_or(platform::Value());
}

/// Bytes from "10 02 01 bb".
inline platform::Bytes bytesFromHex(std::string text)
{
    std::string bytes;
    std::erase(text, ' ');
    for (std::size_t i = 0; i + 1 < text.size(); i += 2)
        bytes += static_cast<char>(std::stoi(text.substr(i, 2), nullptr, 16));
    return platform::Bytes(std::move(bytes));
}

/// A record in its IPC form, but with a peer's address in hexadecimal.
inline std::shared_ptr<ZRFeedback> feedbackFrom(std::string_view json)
{
    platform::Value value = parsed(json);
    constexpr const char* kPeer = "_kCFNTimingDataConnectionPeerAddress";
    if (const std::string* address = value["networkTimingData"][kPeer].asString()) {
        const platform::Bytes bytes = bytesFromHex(*address);
        platform::Value timing = value["networkTimingData"];
        timing.mutableDictionary().set(kPeer, bytes);
        value.mutableDictionary().set("networkTimingData", timing);
    }
    const auto record = platform::castRecord<ZRFeedback>(platform::recordFromValue(value, tavrindRecordClasses()));
    EXPECT_TRUE(record) << json << ": " << record.error().description();
    return record.value_or(std::make_shared<ZRFeedback>());
}

/// The event of the page's examples: of query 12, the client's 3, a second and a half into the session.
inline std::string eventFor(std::string_view recordJson)
{
    TavrinFeedback event(feedbackFrom(recordJson), 12, "guid", "Example/1", 3);
    event.relTimestamp = 1500;
    const std::string bytes = platform::archive(event);
    platform::OpenArchive archive(tavrindRecordClasses());
    platform::JsonTextSink text;
    EXPECT_TRUE(archive.open(bytes));
    TavrinFeedback::write(text, archive.root().as<TavrinFeedback>(), event.relTimestamp);
    EXPECT_EQ(text.text(), platform::toJson(event.dictionary())) << "an upload and a reply have the same event";
    return text.text();
}

} // namespace tavrin
