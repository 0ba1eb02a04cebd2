#pragma once

#include <string>

#include "platform/Files.h"
#include "platform/Value.h"

namespace tavrin {

struct Assembly;

/// The resource files that the bag lists. It has none yet. Any thread.
class DownloadManager {
public:
    explicit DownloadManager(Assembly& assembly) : _assembly(assembly) {}

    struct Resource {
        platform::FileHandle file;
        platform::Value attributes; ///< dictionary
    };
    /// A handle of its own for each call; a resource that isn't there is error 404.
    [[nodiscard]] platform::Result<Resource> fileHandleForResource(const std::string& identifier) const;
    /// Resource identifier to version.
    [[nodiscard]] platform::Dictionary resourceVersions() const { return {}; }

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
