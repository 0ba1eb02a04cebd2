#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "platform/values/Error.h"

namespace platform {

class FileHandle;
class FileSystem;

/// Holds the source files from which the device's text recognisers know words, one for each kind. Any thread, but one
/// at a time for each kind.
class DataDetectorStore {
public:
    virtual ~DataDetectorStore() = default;
    /// Makes a copy of `file` the source of the kind, identified by `signature`; null removes the source. After an
    /// error the kind has either its old source or one without a signature.
    [[nodiscard]] virtual Result<void> setSource(int kind, const FileHandle* file, const std::string& signature) = 0;
    /// Returns the signature of the kind's source; nothing if there is no source or it may be incomplete.
    [[nodiscard]] virtual std::optional<std::string> clientSignature(int kind) = 0;
};

/// Keeps the files "KIND.source" and "KIND.signature" in a directory, which it makes with the first of them. The
/// signature is written last and removed first, so that it never stands for another source, even after a kill.
[[nodiscard]] std::unique_ptr<DataDetectorStore> makeDataDetectorStore(FileSystem& files,
                                                                       std::filesystem::path directory);

} // namespace platform
