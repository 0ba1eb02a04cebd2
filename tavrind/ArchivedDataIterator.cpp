#include "tavrind/ArchivedDataIterator.h"

#include <cstring>

#include "tavrind/TavrinLogging.h"

namespace tavrin {

std::uint64_t ArchivedDataIterator::_length() const
{
    std::uint64_t length = 0;
    std::memcpy(&length, _data.data() + _position, sizeof(length));
    return length;
}

std::optional<std::string_view> ArchivedDataIterator::readNextObject()
{
    const platform::Log& log = TavrinLogForCategory(kLogFeedbackStorage);
    const auto failed = [&log](const char* text) {
        log.error("{}", text);
        return std::nullopt;
    };
    // Of an end with a bare length hasMore says yes and this says no: the end of a file that was cut right there.
    if (_position + kLengthSize >= _data.size()) return failed("out of range");
    const std::uint64_t length = _length();
    if (length == 0) return failed("empty data file");
    if (length > _data.size() - _position - kLengthSize) return failed("broken version string in file");
    const auto archive = _data.view().substr(_position + kLengthSize, length);
    _position += kLengthSize + length;
    return archive;
}

} // namespace tavrin
