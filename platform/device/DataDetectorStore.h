#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "platform/values/Error.h"

namespace platform {

class FileHandle;
class FileSystem;

/// Where the device's text recognisers take from what words mean: a source file of each kind. Any thread; one at a time
/// for each kind.
class DataDetectorStore {
public:
    virtual ~DataDetectorStore() = default;
    /// Makes a copy of `file` the source of that kind, known by `signature`; null takes the source away.
    [[nodiscard]] virtual Result<void> setSource(int kind, const FileHandle* file, const std::string& signature) = 0;
    /// What the kind's current source is known by; none where there is no source, or it isn't whole.
    [[nodiscard]] virtual std::optional<std::string> clientSignature(int kind) = 0;
};

/// A directory, made when something is installed: the files "KIND.source" and "KIND.signature". The signature is
/// written last and removed first, so that it never speaks for another source, whenever the process ends.
[[nodiscard]] std::unique_ptr<DataDetectorStore> makeDataDetectorStore(FileSystem& files,
                                                                       std::filesystem::path directory);

} // namespace platform
