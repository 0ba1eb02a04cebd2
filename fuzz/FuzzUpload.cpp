#include <vector>

#include "fuzz/Sessions.h"
#include "fuzz/Values.h"
#include "platform/values/Archive.h"
#include "platform/values/Json.h"

using namespace tavrin;

/// A session's events as a JSON array, with bytes and dates as `fuzz::enriched` has them, in the order of the file and
/// with their fields in any order. An event is taken exactly if it can be read as a record, and what is uploaded is
/// what the slow way makes of the records.
void runInput(std::string_view input)
{
    const auto json = platform::parseJson(input);
    if (!json || !json->asArray()) return;
    std::vector<std::size_t> lengths;
    std::string archives;
    for (const platform::Value& event : *json->asArray()) {
        const std::string archive = platform::archiveValue(fuzz::enriched(event));
        lengths.push_back(archive.size());
        archives += archive;
    }

    const platform::Bytes file(std::move(archives));
    ClientSessionHeader header;
    header.agent = "Example/1";
    StoredSession session(std::move(header), file);
    std::size_t events = 0;
    std::size_t begin = 0;
    for (const std::size_t length : lengths) {
        const std::string_view archive = file.view().substr(begin, length);
        begin += length;
        const auto added = session.add(archive);
        const auto record = platform::unarchive(archive, sessionFileClasses());
        check(added.has_value() == record.has_value(), added ? "read" : added.error().reason());
        const auto event = record ? std::dynamic_pointer_cast<TavrinFeedback>(*record) : nullptr;
        const bool isKept = event && !event->dictionary().isNull(); // null if it is nested too deep
        check(!added || *added == isKept);
        events += isKept ? 1 : 0;
    }
    check(session.recordedEvents() == events && session.feedbacks().size() == events);
    fuzz::checkUpload(session);
}
