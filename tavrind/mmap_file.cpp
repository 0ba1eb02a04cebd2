#include "tavrind/mmap_file.h"

#include <cerrno>
#include <fcntl.h>

namespace tavrin {

namespace {

/// Only files made by memfd_create have seals.
bool isInMemory(const platform::FileHandle& file)
{
    return fcntl(file.fd(), F_GET_SEALS) >= 0;
}

} // namespace

platform::Result<platform::Bytes> mmapFileHandle(const platform::FileHandle& file)
{
    const auto info = platform::fileInfo(file);
    if (!info) return std::unexpected(info.error());
    if (info->size == 0) return std::unexpected(platform::Error::posix(EINVAL));
    if (info->size > kLargestMappedFile) return std::unexpected(platform::Error::posix(EFBIG));
    if (isInMemory(file)) return platform::mapFile(file, info->size);
    auto contents = platform::readFile(file, kLargestMappedFile);
    if (contents && contents->size() < info->size) return std::unexpected(platform::Error::posix(EIO));
    return contents;
}

} // namespace tavrin
