#include "tests/power/RecordedDisk.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <random>
#include <set>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <fmt/format.h>

namespace platform::test {

namespace fs = std::filesystem;

static RecordedDisk* recorder = nullptr; // the disk that remembers

namespace {

constexpr std::size_t kPage = 4096;

} // namespace

/// What survives, decision by decision.
class RecordedDisk::Dice {
public:
    Dice(Luck luck, std::size_t calls)
        : _luck(luck), _random(static_cast<unsigned>(calls) * 1009 + luck.number), _inOrder(luck.number % 2 == 0)
    {}
    /// Whether an unsynced change of a directory survives, after which as many as `left` follow. By chance, half of the
    /// seeds keep the order of all changes, as a journal does.
    bool keepsEntry(std::size_t left)
    {
        switch (_luck.kind) {
        case Kind::Nothing:
        case Kind::Contents: return false;
        case Kind::AllBut: return left != _luck.number;
        case Kind::Only: return left == _luck.number;
        case Kind::Chance: _kept = (_kept || !_inOrder) && _random() % 4 != 0; return _kept;
        default: return true;
        }
    }
    /// Which of `changes` unsynced versions of a page survives; 0 is the synced one.
    std::size_t page(std::size_t changes)
    {
        if (_luck.kind == Kind::Chance) return _random() % (changes + 1);
        const bool none = _luck.kind == Kind::Nothing || _luck.kind == Kind::Names || _luck.kind == Kind::NamesAndSizes;
        return none ? 0 : changes;
    }
    std::size_t size(std::size_t changes) { return _luck.kind == Kind::NamesAndSizes ? changes : page(changes); }
    /// Whether a page that was never written has what was in its block before.
    bool isStale() { return _luck.kind == Kind::Chance && !_inOrder; }

private:
    using Kind = Luck::Kind;
    const Luck _luck;
    std::minstd_rand _random;
    const bool _inOrder;
    bool _kept = true;
};

RecordedDisk::RecordedDisk()
{
    struct stat status{};
    stat(root.c_str(), &status);
    _device = status.st_dev;
    _root = status.st_ino;
    _nodes[_root] = "";
    _isDirectory[_root] = true;
    recorder = this;
}

RecordedDisk::~RecordedDisk()
{
    stop();
}

void RecordedDisk::stop()
{
    recorder = nullptr;
}

std::optional<RecordedDisk::Place> RecordedDisk::placeOf(const char* path) const
{
    const fs::path whole(path);
    struct stat status{};
    if (stat(whole.parent_path().c_str(), &status) != 0 || status.st_dev != _device) return std::nullopt;
    if (!_nodes.contains(status.st_ino)) return std::nullopt;
    return Place{status.st_ino, whole.filename()};
}

std::optional<RecordedDisk::Node> RecordedDisk::nodeOf(int file) const
{
    struct stat status{};
    if (fstat(file, &status) != 0 || status.st_dev != _device || !_nodes.contains(status.st_ino)) return std::nullopt;
    return status.st_ino;
}

/// After a call that has put a file or directory at `added`, or removed the one at `removed`, or both.
void RecordedDisk::changeEntries(const char* removed, const char* added)
{
    auto from = removed ? placeOf(removed) : std::nullopt;
    auto to = added ? placeOf(added) : std::nullopt;
    if (!from && !to) return;
    if (removed && added && (!from || !to)) {
        std::fprintf(stderr, "a rename from or to elsewhere, which is not remembered: %s\n", added);
        std::abort();
    }
    Node node = 0;
    struct stat status{};
    if (added && stat(added, &status) == 0) {
        node = status.st_ino;
        _nodes.try_emplace(node, fs::path(added).lexically_relative(root));
        _isDirectory[node] = S_ISDIR(status.st_mode);
    }
    _calls.push_back({.kind = Call::Kind::Entries, .node = node, .removed = std::move(from), .added = std::move(to)});
}

void RecordedDisk::noteCall(int file, Call call)
{
    const auto node = nodeOf(file);
    if (!node) return;
    call.node = *node;
    _callsOf[*node].push_back(_calls.size());
    _calls.push_back(std::move(call));
}

void RecordedDisk::write(int file, off_t offset, std::string data)
{
    noteCall(file, {.kind = Call::Kind::Write, .offset = static_cast<std::size_t>(offset), .data = std::move(data)});
}

void RecordedDisk::truncate(int file, off_t size)
{
    noteCall(file, {.kind = Call::Kind::Truncate, .offset = static_cast<std::size_t>(size)});
}

void RecordedDisk::sync(int fileOrDirectory)
{
    noteCall(fileOrDirectory, {.kind = Call::Kind::Sync});
}

bool RecordedDisk::changesContents(std::size_t call) const
{
    if (call >= _calls.size()) return false;
    return _calls[call].kind == Call::Kind::Write || _calls[call].kind == Call::Kind::Truncate;
}

std::string RecordedDisk::describe(std::size_t call) const
{
    if (call >= _calls.size()) return "the end";
    const Call& made = _calls[call];
    const auto pathOf = [this](const Place& place) { return _nodes.at(place.directory) + "/" + place.name + " "; };
    if (made.kind == Call::Kind::Entries)
        return (made.removed ? "remove " + pathOf(*made.removed) : "") +
               (made.added ? "add " + pathOf(*made.added) : "");
    constexpr const char* kNames[]{"", "write", "truncate", "sync"};
    return fmt::format("{} {}, offset {}, {} bytes", kNames[static_cast<int>(made.kind)], _nodes.at(made.node),
                       made.offset, made.data.size());
}

std::string RecordedDisk::contentsOf(Node node, std::size_t calls, Dice& dice) const
{
    const auto found = _callsOf.find(node);
    if (found == _callsOf.end()) return "";
    const std::vector<std::size_t>& all = found->second;
    const auto end = std::ranges::lower_bound(all, calls);
    auto unsynced = all.begin();
    for (auto each = all.begin(); each != end; ++each)
        if (_calls[*each].kind == Call::Kind::Sync) unsynced = each + 1;

    // The changes up to the last sync, then those of which each page has seen some.
    std::string contents;
    const auto resize = [](std::string& some, const Call& call) {
        some.resize(call.kind == Call::Kind::Write ? std::max(some.size(), call.offset + call.data.size())
                                                   : call.offset);
    };
    for (auto each = all.begin(); each != unsynced; ++each) {
        const Call& call = _calls[*each];
        if (call.kind == Call::Kind::Sync) continue;
        resize(contents, call);
        contents.replace(call.offset, call.data.size(), call.data);
    }
    if (unsynced == end) return contents;

    std::vector<std::size_t> sizes{contents.size()};
    std::size_t size = contents.size(), largest = size;
    std::map<std::size_t, std::size_t> changes; // of each page
    const auto pages = [&](const Call& call, std::size_t sizeBefore, const auto& each) {
        const bool isWrite = call.kind == Call::Kind::Write;
        const std::size_t begin = isWrite ? call.offset : std::min(call.offset, sizeBefore);
        const std::size_t stop = isWrite ? call.offset + call.data.size() : sizeBefore;
        for (std::size_t page = begin / kPage; page * kPage < stop; ++page)
            each(page, std::max(begin, page * kPage), std::min(stop, (page + 1) * kPage));
    };
    for (auto each = unsynced; each != end; ++each) {
        const Call& call = _calls[*each];
        pages(call, size, [&](std::size_t page, std::size_t, std::size_t) { ++changes[page]; });
        size = call.kind == Call::Kind::Write ? std::max(size, call.offset + call.data.size()) : call.offset;
        largest = std::max(largest, size);
        sizes.push_back(size);
    }
    const std::size_t synced = contents.size();
    contents.resize(largest);
    for (auto& [page, left] : changes) {
        left = dice.page(left);
        const std::size_t begin = std::max(page * kPage, synced), stop = std::min(largest, (page + 1) * kPage);
        if (left == 0 && begin < stop && dice.isStale()) contents.replace(begin, stop - begin, stop - begin, '\x5a');
    }
    size = synced;
    for (auto each = unsynced; each != end; ++each) {
        const Call& call = _calls[*each];
        pages(call, size, [&](std::size_t page, std::size_t from, std::size_t to) {
            if (changes[page] == 0) return;
            --changes[page];
            if (call.kind == Call::Kind::Write)
                contents.replace(from, to - from, call.data, from - call.offset, to - from);
            else
                contents.replace(from, to - from, to - from, '\0');
        });
        size = call.kind == Call::Kind::Write ? std::max(size, call.offset + call.data.size()) : call.offset;
    }
    contents.resize(sizes[dice.size(sizes.size() - 1)]);
    return contents;
}

std::vector<bool> RecordedDisk::isDurable(std::size_t calls) const
{
    std::set<Node> synced;
    std::vector<bool> durable;
    for (std::size_t i = calls; i-- > 0;) {
        const Call& call = _calls[i];
        if (call.kind == Call::Kind::Sync) synced.insert(call.node);
        if (call.kind == Call::Kind::Entries)
            durable.push_back((call.removed && synced.contains(call.removed->directory)) ||
                              (call.added && synced.contains(call.added->directory)));
    }
    std::reverse(durable.begin(), durable.end());
    return durable;
}

RecordedDisk::Image RecordedDisk::after(std::size_t calls, Luck luck) const
{
    const std::vector<bool> durable = isDurable(calls);
    auto left = static_cast<std::size_t>(std::ranges::count(durable, false));
    Dice dice(luck, calls);
    std::map<Place, Node> entries;
    auto isSafe = durable.begin();
    for (std::size_t i = 0; i < calls; ++i) {
        const Call& call = _calls[i];
        if (call.kind != Call::Kind::Entries || (!*isSafe++ && !dice.keepsEntry(--left))) continue;
        if (call.removed) entries.erase(*call.removed);
        if (call.added) entries[*call.added] = call.node;
    }
    Image image;
    const auto fill = [&](const auto& self, Node directory, const std::string& path) -> void {
        for (auto each = entries.lower_bound({directory, ""});
             each != entries.end() && each->first.directory == directory; ++each) {
            const std::string name = path + each->first.name;
            if (_isDirectory.at(each->second)) {
                image[name] = std::nullopt;
                self(self, each->second, name + "/");
            } else {
                image[name] = contentsOf(each->second, calls, dice);
            }
        }
    };
    fill(fill, _root, "");
    return image;
}

RecordedDisk::Image RecordedDisk::now() const
{
    Image image;
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        auto& contents = image[entry.path().lexically_relative(root)];
        if (entry.is_directory()) continue;
        std::ifstream file(entry.path(), std::ios::binary);
        contents.emplace(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>());
    }
    return image;
}

void RecordedDisk::put(const Image& image) const
{
    for (const auto& entry : fs::directory_iterator(root)) fs::remove_all(entry.path());
    for (const auto& [name, contents] : image) { // a directory comes before what is in it
        if (contents)
            writeFile(root / name, *contents);
        else
            fs::create_directory(root / name);
    }
}

} // namespace platform::test

// ---- the system calls of this program ----

namespace {

using platform::test::recorder;

/// Where a write without an offset goes.
off_t positionOf(int file)
{
    struct stat status{};
    const bool appends = (fcntl(file, F_GETFL) & O_APPEND) != 0 && fstat(file, &status) == 0;
    return appends ? status.st_size : lseek(file, 0, SEEK_CUR);
}

template <class Write> ssize_t written(int file, off_t offset, Write write, const iovec* parts, int count)
{
    const ssize_t size = write();
    if (!recorder || size <= 0) return size;
    std::string data;
    for (int i = 0; i < count; ++i) data.append(static_cast<const char*>(parts[i].iov_base), parts[i].iov_len);
    data.resize(static_cast<std::size_t>(size));
    recorder->write(file, offset, std::move(data));
    return size;
}

int synced(long call, int file)
{
    const auto result = static_cast<int>(syscall(call, file));
    if (result == 0 && recorder) recorder->sync(file);
    return result;
}

int removed(int directory, const char* path, int flags)
{
    std::string whole = path;
    if (recorder && directory != AT_FDCWD && *path != '/')
        whole = std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(directory)) / path;
    const auto result = static_cast<int>(syscall(SYS_unlinkat, directory, path, flags));
    if (result == 0 && recorder) recorder->changeEntries(whole.c_str(), nullptr);
    return result;
}

} // namespace

extern "C" {

int open(const char* path, int flags, ...)
{
    va_list arguments;
    va_start(arguments, flags);
    const auto mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
    va_end(arguments);
    struct stat status{};
    const bool adds = recorder && (flags & O_CREAT) != 0 && lstat(path, &status) != 0;
    const auto file = static_cast<int>(syscall(SYS_openat, AT_FDCWD, path, flags, mode));
    if (file < 0 || !recorder) return file;
    if (adds)
        recorder->changeEntries(nullptr, path);
    else if ((flags & O_TRUNC) != 0)
        recorder->truncate(file, 0);
    return file;
}

ssize_t write(int file, const void* data, size_t size)
{
    const iovec part{const_cast<void*>(data), size};
    const off_t offset = recorder ? positionOf(file) : 0;
    return written(file, offset, [&] { return syscall(SYS_write, file, data, size); }, &part, 1);
}

ssize_t pwrite(int file, const void* data, size_t size, off_t offset)
{
    const iovec part{const_cast<void*>(data), size};
    return written(file, offset, [&] { return syscall(SYS_pwrite64, file, data, size, offset); }, &part, 1);
}

ssize_t writev(int file, const iovec* parts, int count)
{
    const off_t offset = recorder ? positionOf(file) : 0;
    return written(file, offset, [&] { return syscall(SYS_writev, file, parts, count); }, parts, count);
}

ssize_t copy_file_range(int from, off64_t* fromOffset, int to, off64_t* toOffset, size_t size, unsigned flags)
{
    const off64_t source = fromOffset ? *fromOffset : lseek(from, 0, SEEK_CUR);
    const off64_t offset = toOffset ? *toOffset : positionOf(to);
    const ssize_t copied = syscall(SYS_copy_file_range, from, fromOffset, to, toOffset, size, flags);
    if (copied <= 0 || !recorder) return copied;
    std::string data(static_cast<std::size_t>(copied), '\0');
    if (syscall(SYS_pread64, from, data.data(), data.size(), source) == copied)
        recorder->write(to, offset, std::move(data));
    return copied;
}

int ftruncate(int file, off_t size) noexcept
{
    const auto result = static_cast<int>(syscall(SYS_ftruncate, file, size));
    if (result == 0 && recorder) recorder->truncate(file, size);
    return result;
}

// The same calls by their other names.
int open64(const char* path, int flags, ...) __attribute__((alias("open")));
ssize_t pwrite64(int file, const void* data, size_t size, off64_t offset) __attribute__((alias("pwrite")));
int ftruncate64(int file, off64_t size) noexcept __attribute__((alias("ftruncate")));

int fsync(int file)
{
    return synced(SYS_fsync, file);
}

int fdatasync(int file)
{
    return synced(SYS_fdatasync, file);
}

int rename(const char* from, const char* to) noexcept
{
    const auto result = static_cast<int>(syscall(SYS_renameat2, AT_FDCWD, from, AT_FDCWD, to, 0));
    if (result == 0 && recorder) recorder->changeEntries(from, to);
    return result;
}

int mkdir(const char* path, mode_t mode) noexcept
{
    const auto result = static_cast<int>(syscall(SYS_mkdirat, AT_FDCWD, path, mode));
    if (result == 0 && recorder) recorder->changeEntries(nullptr, path);
    return result;
}

int rmdir(const char* path) noexcept
{
    return removed(AT_FDCWD, path, AT_REMOVEDIR);
}

int unlink(const char* path) noexcept
{
    return removed(AT_FDCWD, path, 0);
}

int remove(const char* path) noexcept
{
    return removed(AT_FDCWD, path, 0) == 0 || (errno == EISDIR && removed(AT_FDCWD, path, AT_REMOVEDIR) == 0) ? 0 : -1;
}

int unlinkat(int directory, const char* path, int flags) noexcept
{
    return removed(directory, path, flags);
}

} // extern "C"
