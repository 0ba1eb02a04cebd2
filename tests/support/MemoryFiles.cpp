#include "tests/support/MemoryFiles.h"

#include <cerrno>
#include <sys/mman.h>
#include <unistd.h>

namespace platform::test {

namespace fs = std::filesystem;

int MemoryFiles::faultOf(std::string_view operation, const fs::path& path) const
{
    return fault ? fault(operation, path) : 0;
}

Result<Bytes> MemoryFiles::read(const fs::path& path, std::size_t maximumSize)
{
    if (const int error = faultOf("read", path)) return std::unexpected(Error::posix(error));
    takeIn(path);
    const auto found = files.find(path);
    if (found == files.end()) return std::unexpected(Error::posix(directories.contains(path) ? EISDIR : ENOENT));
    if (found->second.size() > maximumSize) return std::unexpected(Error::posix(EFBIG));
    return Bytes(found->second);
}

/// Reads what was written by a handle.
void MemoryFiles::takeIn(const fs::path& path)
{
    if (const auto written = _written.find(path); written != _written.end() && files.contains(path))
        files[path] = readFile(written->second, SIZE_MAX)->view();
}

Result<void> MemoryFiles::writeAtomically(const fs::path& path, std::string_view contents)
{
    return write("write", path, contents);
}

Result<void> MemoryFiles::writeUnsynced(const fs::path& path, std::string_view contents)
{
    return write("unsynced", path, contents);
}

Result<void> MemoryFiles::write(std::string_view operation, const fs::path& path, std::string_view contents)
{
    if (const int error = faultOf(operation, path)) return std::unexpected(Error::posix(error));
    if (!directories.contains(path.parent_path())) return std::unexpected(Error::posix(ENOENT));
    if (directories.contains(path)) return std::unexpected(Error::posix(EISDIR));
    files[path] = contents;
    return {};
}

Result<void> MemoryFiles::replace(const fs::path& path, const fs::path& source)
{
    if (const int error = faultOf("replace", path)) return std::unexpected(Error::posix(error));
    takeIn(source);
    _written.erase(source);
    if (!files.contains(source) || !directories.contains(path.parent_path()))
        return std::unexpected(Error::posix(ENOENT));
    if (directories.contains(path)) return std::unexpected(Error::posix(EISDIR));
    files[path] = files.extract(source).mapped();
    return {};
}

Result<void> MemoryFiles::copy(const fs::path& path, const FileHandle& source, std::uint64_t maximumSize)
{
    const auto contents = readFile(source, maximumSize);
    if (!contents) return std::unexpected(contents.error());
    return writeAtomically(path, contents->view());
}

Result<FileHandle> MemoryFiles::create(const fs::path& path)
{
    if (auto made = write("make", path, ""); !made) return std::unexpected(made.error());
    const FileHandle& file = _written[path] = FileHandle(memfd_create("file", MFD_CLOEXEC));
    return file.duplicate();
}

Result<void> MemoryFiles::sync(const fs::path& path)
{
    if (const int error = faultOf("sync", path)) return std::unexpected(Error::posix(error));
    if (!files.contains(path)) return std::unexpected(Error::posix(ENOENT));
    return {};
}

Result<void> MemoryFiles::createDirectories(const fs::path& path)
{
    if (const int error = faultOf("mkdir", path)) return std::unexpected(Error::posix(error));
    for (fs::path each = path; each.has_relative_path(); each = each.parent_path()) {
        if (files.contains(each)) return std::unexpected(Error::posix(ENOTDIR));
        directories.insert(each);
    }
    return {};
}

Result<FileInfo> MemoryFiles::info(const fs::path& path)
{
    if (const int error = faultOf("info", path)) return std::unexpected(Error::posix(error));
    takeIn(path);
    if (directories.contains(path)) return FileInfo{.kind = FileInfo::Kind::Directory};
    if (!files.contains(path)) return std::unexpected(Error::posix(ENOENT));
    const Date date = created.contains(path) ? created[path] : dateFromSecondsSince1970(1767225600);
    return FileInfo{.size = files[path].size(), .modified = date, .created = date};
}

Result<void> MemoryFiles::remove(const fs::path& path)
{
    if (const int error = faultOf("remove", path)) return std::unexpected(Error::posix(error));
    if (files.erase(path) == 0) return std::unexpected(Error::posix(ENOENT));
    return {};
}

Result<void> MemoryFiles::removeDirectory(const fs::path& path)
{
    if (const int error = faultOf("remove", path)) return std::unexpected(Error::posix(error));
    std::erase_if(files, [&](const auto& file) { return file.first.string().starts_with(path.string() + "/"); });
    std::erase_if(directories,
                  [&](const fs::path& each) { return each == path || each.string().starts_with(path.string() + "/"); });
    return {};
}

Result<void> MemoryFiles::syncDirectory(const fs::path& path)
{
    if (const int error = faultOf("syncdir", path)) return std::unexpected(Error::posix(error));
    return {};
}

Result<std::vector<std::string>> MemoryFiles::list(const fs::path& path)
{
    if (const int error = faultOf("list", path)) return std::unexpected(Error::posix(error));
    if (!directories.contains(path)) return std::unexpected(Error::posix(ENOENT));
    std::vector<std::string> names;
    for (const auto& [file, contents] : files)
        if (file.parent_path() == path) names.push_back(file.filename());
    for (const fs::path& directory : directories)
        if (directory.parent_path() == path) names.push_back(directory.filename());
    return names;
}

Result<FileHandle> MemoryFiles::openForReading(const fs::path& path)
{
    auto contents = read(path, SIZE_MAX);
    if (!contents) return std::unexpected(contents.error());
    FileHandle handle(memfd_create("file", MFD_CLOEXEC));
    if (::write(handle.fd(), contents->data(), contents->size()) < 0) return std::unexpected(Error::posix(errno));
    lseek(handle.fd(), 0, SEEK_SET);
    return handle;
}

Result<FileHandle> MemoryFiles::lock(const fs::path& path)
{
    if (const int error = faultOf("lock", path)) return std::unexpected(Error::posix(error));
    return FileHandle(memfd_create("lock", MFD_CLOEXEC));
}

Result<FileHandle> MemoryFiles::takeDirectory(const fs::path& path)
{
    if (const int error = faultOf("take", path)) return std::unexpected(Error::posix(error));
    for (fs::path each = path; each.has_relative_path(); each = each.parent_path()) directories.insert(each);
    return FileHandle(memfd_create("lock", MFD_CLOEXEC));
}

Result<Sqlite> MemoryFiles::openDatabase(const fs::path& path, Sqlite::Access access)
{
    if (const int error = faultOf("database", path)) return std::unexpected(Error::posix(error));
    if (!_databases) _databases.emplace("/dev/shm");
    const fs::path real = _databases->path / path.relative_path();
    fs::create_directories(real.parent_path());
    const auto found = files.find(path);
    if (found == files.end()) {
        if (access == Sqlite::Access::ReadOnly) return std::unexpected(Error::posix(ENOENT));
        for (const char* suffix : {"", "-wal", "-journal"}) fs::remove(real.string() + suffix);
        files[path];
    } else if (!found->second.empty()) {
        writeFile(real, std::exchange(found->second, {}));
    }
    return Sqlite::open(real, access);
}

Result<FileHandle> MemoryFiles::createTemporary()
{
    if (const int error = faultOf("temporary", {})) return std::unexpected(Error::posix(error));
    return FileHandle(memfd_create("temporary", MFD_CLOEXEC));
}

class MemoryFiles::Appending final : public AppendFile {
public:
    Appending(MemoryFiles& files, fs::path path) : _files(files), _path(std::move(path)) {}
    std::uint64_t size() const override { return _files.files[_path].size(); }
    Result<void> append(std::initializer_list<std::string_view> parts) override
    {
        if (const int error = _files.faultOf("append", _path)) return std::unexpected(Error::posix(error));
        for (const std::string_view part : parts) _files.files[_path] += part;
        return {};
    }

private:
    MemoryFiles& _files;
    fs::path _path;
};

Result<std::unique_ptr<AppendFile>> MemoryFiles::createForAppending(const fs::path& path)
{
    if (const int error = faultOf("create", path)) return std::unexpected(Error::posix(error));
    if (!directories.contains(path.parent_path())) return std::unexpected(Error::posix(ENOENT));
    if (files.contains(path) || directories.contains(path)) return std::unexpected(Error::posix(EEXIST));
    files[path];
    return std::make_unique<Appending>(*this, path);
}

} // namespace platform::test
