#include "tavrind/ArchivedDataIterator.h"

#include <cstring>

#include "tavrind/TavrinLogging.h"

namespace tavrin {

std::expected<std::string_view, const char*> ArchivedDataIterator::_next()
{
    // If only a length is left, hasMore() returns true and this fails: the file was truncated there.
    if (_position + kLengthSize >= _data.size()) return std::unexpected("out of range");
    std::uint64_t length = 0;
    std::memcpy(&length, _data.data() + _position, sizeof(length));
    if (length == 0) return std::unexpected("empty data file");
    if (length > _data.size() - _position - kLengthSize) return std::unexpected("broken version string in file");
    const auto archive = _data.view().substr(_position + kLengthSize, length);
    _position += kLengthSize + length;
    return archive;
}

std::optional<std::string_view> ArchivedDataIterator::readNextObject()
{
    const auto archive = _next();
    if (archive) return *archive;
    log(kLogFeedbackStorage).error("{}", archive.error());
    return std::nullopt;
}

std::uint64_t ArchivedDataIterator::countRecords()
{
    std::uint64_t count = 0;
    while (_next()) ++count;
    return count;
}

} // namespace tavrin
