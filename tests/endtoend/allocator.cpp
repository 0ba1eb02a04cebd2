// The C++ allocator of tavrind_allocations. An allocation fails if `allocationFails` of failing.c, which may be loaded,
// says so.

#include <cstdlib>
#include <dlfcn.h>
#include <new>

namespace {

void* allocate(std::size_t size, std::size_t alignment = 0) noexcept
{
    static const auto allocationFails = reinterpret_cast<bool (*)()>(dlsym(RTLD_DEFAULT, "allocationFails"));
    if (allocationFails && allocationFails()) return nullptr;
    return alignment == 0 ? std::malloc(size)
                          : std::aligned_alloc(alignment, (size + alignment - 1) & ~(alignment - 1));
}

void* allocateOrThrow(std::size_t size, std::size_t alignment = 0)
{
    if (void* made = allocate(size, alignment)) return made;
    throw std::bad_alloc();
}

} // namespace

// clang-format off
void* operator new(std::size_t size) { return allocateOrThrow(size); }
void* operator new[](std::size_t size) { return allocateOrThrow(size); }
void* operator new(std::size_t size, std::align_val_t at) { return allocateOrThrow(size, static_cast<std::size_t>(at)); }
void* operator new[](std::size_t size, std::align_val_t at) { return allocateOrThrow(size, static_cast<std::size_t>(at)); }
void* operator new(std::size_t size, const std::nothrow_t&) noexcept { return allocate(size); }
void* operator new[](std::size_t size, const std::nothrow_t&) noexcept { return allocate(size); }
void operator delete(void* made) noexcept { std::free(made); }
void operator delete[](void* made) noexcept { std::free(made); }
void operator delete(void* made, std::size_t) noexcept { std::free(made); }
void operator delete[](void* made, std::size_t) noexcept { std::free(made); }
void operator delete(void* made, std::align_val_t) noexcept { std::free(made); }
void operator delete[](void* made, std::align_val_t) noexcept { std::free(made); }
void operator delete(void* made, std::size_t, std::align_val_t) noexcept { std::free(made); }
void operator delete[](void* made, std::size_t, std::align_val_t) noexcept { std::free(made); }
// clang-format on
