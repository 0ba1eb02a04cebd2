#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include "platform/values/Error.h"

namespace platform {

class FileHandle;
class FileSystem;

/// Stores the source files of the device's text recognisers, one for each kind. Any thread, one at a time for each
/// kind.
class DataDetectorStore {
public:
    virtual ~DataDetectorStore() = default;
    /// Replaces the source of the kind by a copy of `file`, identified by `signature`; null removes the source. After
    /// an error the kind has either its old source or one without a signature.
    [[nodiscard]] virtual Result<void> setSource(int kind, const FileHandle* file, const std::string& signature) = 0;
    /// Returns the signature of the kind's source; nothing if the source is missing or may be incomplete.
    [[nodiscard]] virtual std::optional<std::string> clientSignature(int kind) = 0;
};

/// Returns a store with the files "KIND.source" and "KIND.signature" in a directory, which it creates with the first
/// file. The signature is written last and removed first, so that it never belongs to another source, even after a
/// kill. `files` must outlive the store.
[[nodiscard]] std::unique_ptr<DataDetectorStore> makeDataDetectorStore(FileSystem& files,
                                                                       std::filesystem::path directory);

} // namespace platform
