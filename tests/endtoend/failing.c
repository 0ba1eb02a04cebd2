// Makes system calls and allocations of a program fail. `cc -shared -fPIC` makes a library of it, for LD_PRELOAD.
//
// FAILING_CONTROL names a file of at least 4 KiB, which is mapped as `struct control` and whose owner may change it at
// any time. FAILING_BELOW is a directory: only calls on files below it, and on files in memory, count. They are written
// to the end of the file FAILING_TRACE, a line each. Works under AddressSanitizer, too: its functions call these.
#define _GNU_SOURCE
#include <dirent.h>
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <linux/limits.h>
#include <stdarg.h>
#include <stdatomic.h>
#include <stdbool.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

// Calls `first` to `last`, counted from 1, fail.
struct range {
    _Atomic uint64_t count, first, last, failed;
};
static struct control {
    struct range calls, allocations;
    _Atomic uint64_t error; // of failing calls
    char what[1024];        // the last call that failed
    char from[1024];        // a pattern: calls count from the first that matches; it is empty from then on
}* control;

static char below[PATH_MAX];
static size_t belowSize;
static int trace = -1;
static _Atomic bool counted[65536]; // by descriptor

__attribute__((constructor)) static void start(void)
{
    const char *file = getenv("FAILING_CONTROL"), *directory = getenv("FAILING_BELOW");
    if (!file || !directory) return;
    const int fd = (int)syscall(SYS_openat, AT_FDCWD, file, O_RDWR | O_CLOEXEC);
    void* mapped = (void*)syscall(SYS_mmap, NULL, sizeof(struct control), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    syscall(SYS_close, fd);
    if (fd < 0 || mapped == MAP_FAILED) abort();
    belowSize = (size_t)snprintf(below, sizeof(below), "%s/", directory);
    const char* traced = getenv("FAILING_TRACE");
    if (traced) trace = (int)syscall(SYS_openat, AT_FDCWD, traced, O_WRONLY | O_APPEND | O_CLOEXEC);
    control = mapped;
}

static bool fails(struct range* range)
{
    const uint64_t number = ++range->count;
    if (number < range->first || number > range->last) return false;
    ++range->failed;
    return true;
}

// True if the call must fail; sets errno.
static bool failsAt(const char* call, const char* path)
{
    char what[sizeof(control->what)];
    snprintf(what, sizeof(what) - 1, "%s %s", call, path);
    if (control->from[0] && fnmatch(control->from, what, 0) != 0) return false;
    control->from[0] = 0;
    const bool failing = fails(&control->calls);
    if (failing) strcpy(control->what, what);
    strcat(what, "\n");
    if (trace >= 0) (void)!syscall(SYS_write, trace, what, strlen(what));
    if (!failing) return false;
    errno = (int)control->error;
    return true;
}

static bool isCounted(int fd)
{
    return control && fd >= 0 && fd < 65536 && counted[fd];
}

static bool isBelow(int directory, const char* path)
{
    if (!control || !path) return false;
    return path[0] == '/' ? strncmp(path, below, belowSize) == 0 : isCounted(directory);
}

static bool failsOn(const char* call, int fd)
{
    if (!isCounted(fd)) return false;
    char link[64], path[PATH_MAX] = "";
    snprintf(link, sizeof(link), "/proc/self/fd/%d", fd);
    (void)!readlink(link, path, sizeof(path) - 1);
    return failsAt(call, path);
}

static bool failsBelow(const char* call, int directory, const char* path)
{
    return isBelow(directory, path) && failsAt(call, path);
}

static int count(int fd, bool isOurs)
{
    if (fd >= 0 && fd < 65536) counted[fd] = isOurs;
    return fd;
}

int openat(int directory, const char* path, int flags, ...)
{
    va_list list;
    va_start(list, flags);
    const mode_t mode = flags & O_CREAT || (flags & O_TMPFILE) == O_TMPFILE ? va_arg(list, mode_t) : 0;
    va_end(list);
    if (failsBelow("open", directory, path)) return -1;
    return count((int)syscall(SYS_openat, directory, path, flags, mode), isBelow(directory, path));
}

int open(const char* path, int flags, ...)
{
    va_list list;
    va_start(list, flags);
    const mode_t mode = flags & O_CREAT || (flags & O_TMPFILE) == O_TMPFILE ? va_arg(list, mode_t) : 0;
    va_end(list);
    return openat(AT_FDCWD, path, flags, mode);
}

int close(int fd)
{
    count(fd, false);
    return (int)syscall(SYS_close, fd);
}

int memfd_create(const char* name, unsigned flags)
{
    if (control && failsAt("memfd_create", name)) return -1;
    return count((int)syscall(SYS_memfd_create, name, flags), control);
}

DIR* opendir(const char* path)
{
    if (failsBelow("opendir", AT_FDCWD, path)) return NULL;
    DIR* (*real)(const char*) = (DIR * (*)(const char*)) dlsym(RTLD_NEXT, "opendir");
    return real(path);
}

// Defines a function whose calls with a counted descriptor `fd` may fail, and otherwise are the system call.
#define ON_FD(result, name, parameters, failure, ...)                                                                  \
    result name parameters                                                                                             \
    {                                                                                                                  \
        if (failsOn(#name, fd)) return failure;                                                                        \
        return (result)syscall(__VA_ARGS__);                                                                           \
    }
ON_FD(ssize_t, write, (int fd, const void* data, size_t size), -1, SYS_write, fd, data, size)
ON_FD(ssize_t, writev, (int fd, const struct iovec* parts, int parts_count), -1, SYS_writev, fd, parts, parts_count)
ON_FD(ssize_t, pwrite, (int fd, const void* data, size_t size, off_t at), -1, SYS_pwrite64, fd, data, size, at)
ON_FD(int, fsync, (int fd), -1, SYS_fsync, fd)
ON_FD(int, fdatasync, (int fd), -1, SYS_fdatasync, fd)
ON_FD(int, ftruncate, (int fd, off_t size), -1, SYS_ftruncate, fd, size)
ON_FD(int, fallocate, (int fd, int mode, off_t at, off_t size), -1, SYS_fallocate, fd, mode, at, size)
ON_FD(void*, mmap, (void* where, size_t size, int access, int flags, int fd, off_t at), MAP_FAILED, SYS_mmap, where,
      size, access, flags, fd, at)

ssize_t copy_file_range(int from, off_t* at, int fd, off_t* to, size_t size, unsigned flags)
{
    if (failsOn("copy_file_range", fd)) return -1;
    return syscall(SYS_copy_file_range, from, at, fd, to, size, flags);
}

#define AT_PATH(name, parameters, directory, path, ...)                                                                \
    int name parameters                                                                                                \
    {                                                                                                                  \
        if (failsBelow(#name, directory, path)) return -1;                                                             \
        return (int)syscall(__VA_ARGS__);                                                                              \
    }
AT_PATH(rename, (const char* from, const char* to), AT_FDCWD, to, SYS_renameat2, AT_FDCWD, from, AT_FDCWD, to, 0)
AT_PATH(mkdir, (const char* path, mode_t mode), AT_FDCWD, path, SYS_mkdirat, AT_FDCWD, path, mode)
AT_PATH(unlink, (const char* path), AT_FDCWD, path, SYS_unlinkat, AT_FDCWD, path, 0)
AT_PATH(unlinkat, (int directory, const char* path, int flags), directory, path, SYS_unlinkat, directory, path, flags)

#define ALIAS(result, name, parameters, of) result name parameters __attribute__((alias(#of)));
ALIAS(int, open64, (const char* path, int flags, ...), open)
ALIAS(int, openat64, (int directory, const char* path, int flags, ...), openat)
ALIAS(ssize_t, pwrite64, (int fd, const void* data, size_t size, off64_t at), pwrite)
ALIAS(int, ftruncate64, (int fd, off64_t size), ftruncate)
ALIAS(int, fallocate64, (int fd, int mode, off64_t at, off64_t size), fallocate)
ALIAS(void*, mmap64, (void* where, size_t size, int access, int flags, int fd, off64_t at), mmap)

// ---- Allocations

// For programs that have an allocator of their own.
bool allocationFails(void)
{
    return control && control->allocations.last && fails(&control->allocations);
}

void* __libc_malloc(size_t size);
void* __libc_calloc(size_t count, size_t size);
void* __libc_realloc(void* old, size_t size);
void* __libc_memalign(size_t alignment, size_t size);

#define ALLOCATION(name, parameters, ...)                                                                              \
    void* name parameters                                                                                              \
    {                                                                                                                  \
        if (!allocationFails()) return __libc_##__VA_ARGS__;                                                           \
        errno = ENOMEM;                                                                                                \
        return NULL;                                                                                                   \
    }
ALLOCATION(malloc, (size_t size), malloc(size))
ALLOCATION(calloc, (size_t number, size_t size), calloc(number, size))
ALLOCATION(realloc, (void* old, size_t size), realloc(old, size))
ALLOCATION(memalign, (size_t alignment, size_t size), memalign(alignment, size))
ALLOCATION(aligned_alloc, (size_t alignment, size_t size), memalign(alignment, size))

int posix_memalign(void** result, size_t alignment, size_t size)
{
    void* const made = memalign(alignment, size);
    if (!made) return ENOMEM;
    *result = made;
    return 0;
}
