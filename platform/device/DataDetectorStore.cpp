#include "platform/device/DataDetectorStore.h"

#include <cerrno>

#include <fmt/format.h>

#include "platform/files/Files.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumSignatureSize = 4096;

class SourceDirectory final : public DataDetectorStore {
public:
    SourceDirectory(FileSystem& files, std::filesystem::path directory)
        : _files(files), _directory(std::move(directory))
    {}

    Result<void> setSource(int kind, const FileHandle* file, const std::string& signature) override
    {
        auto gone = unlessMissing(_files.remove(path(kind, "signature")));
        if (gone && !file) gone = unlessMissing(_files.remove(path(kind, "source")));
        // After a power cut, a new source must not have the old signature.
        if (gone) gone = unlessMissing(_files.syncDirectory(_directory));
        if (!gone || !file) return gone;
        if (auto made = _files.createDirectories(_directory); !made) return made;
        if (auto copied = _files.copy(path(kind, "source"), *file); !copied) return copied;
        if (signature.empty()) return {};
        return _files.writeAtomically(path(kind, "signature"), signature);
    }

    std::optional<std::string> clientSignature(int kind) override
    {
        const auto signature = _files.read(path(kind, "signature"), kMaximumSignatureSize);
        if (!signature || !_files.info(path(kind, "source"))) return std::nullopt;
        return std::string(signature->view());
    }

private:
    [[nodiscard]] std::filesystem::path path(int kind, const char* what) const
    {
        return _directory / fmt::format("{}.{}", kind, what);
    }
    static Result<void> unlessMissing(Result<void> done)
    {
        return !done && done.error().code == ENOENT ? Result<void>() : done;
    }

    FileSystem& _files;
    const std::filesystem::path _directory;
};

} // namespace

std::unique_ptr<DataDetectorStore> makeDataDetectorStore(FileSystem& files, std::filesystem::path directory)
{
    return std::make_unique<SourceDirectory>(files, std::move(directory));
}

} // namespace platform
