#include "tavrind/mmap_file.h"

#include <cerrno>
#include <sys/mman.h>
#include <sys/stat.h>

namespace tavrin {

platform::Result<platform::Bytes> mmapFileHandle(const platform::FileHandle& file)
{
    struct stat status{};
    if (fstat(file.fd(), &status) != 0) return std::unexpected(platform::Error::posix(errno));
    const auto size = static_cast<std::size_t>(status.st_size);
    void* address = mmap(nullptr, size, PROT_READ, MAP_PRIVATE, file.fd(), 0);
    if (address == MAP_FAILED) return std::unexpected(platform::Error::posix(errno));
    const std::shared_ptr<const void> owner(address, [size](void* mapped) { munmap(mapped, size); });
    return platform::Bytes(owner, {static_cast<const char*>(address), size});
}

} // namespace tavrin
