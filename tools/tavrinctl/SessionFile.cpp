#include "tools/tavrinctl/SessionFile.h"

#include <cstring>
#include <expected>

#include <fmt/format.h>

#include "platform/values/Archive.h"
#include "platform/values/Record.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

constexpr std::size_t kLengthSize = sizeof(std::uint64_t);

/// Returns the archive of the record at `offset`, without its length.
std::expected<std::string_view, std::string> archiveAt(std::string_view bytes, std::size_t offset)
{
    const std::size_t left = bytes.size() - offset;
    if (left < kLengthSize) return std::unexpected(fmt::format("{} bytes are too few for a record's length", left));
    std::uint64_t length = 0;
    std::memcpy(&length, bytes.data() + offset, kLengthSize);
    if (length == 0) return std::unexpected("an empty record");
    if (length > left - kLengthSize)
        return std::unexpected(
            fmt::format("cut off: a record of {} bytes, of which {} are there", length, left - kLengthSize));
    return bytes.substr(offset + kLengthSize, length);
}

bool isOfClass(const Value& value, std::string_view name)
{
    const std::string* className = value["class"].asString();
    return className && *className == name;
}

/// Consumes the next record. Returns what is wrong with it, if anything.
std::optional<std::string> take(SessionFile& file, std::size_t offset, std::string_view archive)
{
    auto value = platform::valueFromArchive(archive);
    if (!value) return "not an archive: " + value.error().reason();
    if (!file.version) {
        if (!value->asString()) return "the first record is not the version's text";
        file.version = *value->asString();
    } else if (file.session.isNull()) {
        if (!isOfClass(*value, "ClientSession")) return "the second record is not a session";
        file.session = std::move(*value);
    } else {
        if (!isOfClass(*value, "TavrinFeedback")) return "no event";
        file.events.push_back({offset, kLengthSize + archive.size(), std::move(*value)});
    }
    return std::nullopt;
}

} // namespace

SessionFile readSessionFile(std::string_view bytes)
{
    SessionFile file;
    std::size_t offset = 0;
    while (offset < bytes.size()) {
        const auto archive = archiveAt(bytes, offset);
        auto problem = archive ? take(file, offset, *archive) : std::optional(archive.error());
        if (problem) {
            file.damage = {offset, std::move(*problem)};
            return file;
        }
        offset += kLengthSize + archive->size();
    }
    if (bytes.empty())
        file.damage = {0, "the file is empty"};
    else if (file.session.isNull())
        file.damage = {offset, "the file ends before its session"};
    return file;
}

} // namespace tavrin::ctl
