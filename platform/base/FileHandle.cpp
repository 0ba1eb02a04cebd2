#include "platform/base/FileHandle.h"

#include <fcntl.h>
#include <unistd.h>
#include <utility>

namespace platform {

FileHandle& FileHandle::operator=(FileHandle&& other) noexcept
{
    if (this != &other) {
        if (_fd >= 0) close(_fd);
        _fd = other.release();
    }
    return *this;
}

FileHandle::~FileHandle()
{
    if (_fd >= 0) close(_fd);
}

int FileHandle::release()
{
    return std::exchange(_fd, -1);
}

FileHandle FileHandle::duplicate() const
{
    return FileHandle(fcntl(_fd, F_DUPFD_CLOEXEC, 0));
}

} // namespace platform
