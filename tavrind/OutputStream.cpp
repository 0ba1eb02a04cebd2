#include "tavrind/OutputStream.h"

#include "platform/files/Files.h"

namespace tavrin {

FileOutputStream::FileOutputStream(std::unique_ptr<platform::AppendFile> file) : _file(std::move(file)) {}

FileOutputStream::~FileOutputStream() = default;

void FileOutputStream::open()
{
    if (_status == StreamStatus::NotOpen) _status = StreamStatus::Open;
}

std::ptrdiff_t FileOutputStream::write(std::string_view bytes)
{
    if (_status != StreamStatus::Open) return -1;
    if (auto written = _file->append({bytes}); !written) {
        _error = std::move(written.error());
        _status = StreamStatus::Error;
        return -1;
    }
    return static_cast<std::ptrdiff_t>(bytes.size());
}

void FileOutputStream::close()
{
    _file.reset();
    if (_status != StreamStatus::Error) _status = StreamStatus::Closed;
}

} // namespace tavrin
