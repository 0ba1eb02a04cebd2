#pragma once

#include <filesystem>
#include <fstream>
#include <stdlib.h>
#include <string>
#include <string_view>

#include "platform/run/RunLoop.h"

namespace platform::test {

/// A new directory, mode 0700, that goes with all that is in it.
struct TemporaryDirectory {
    explicit TemporaryDirectory(const std::filesystem::path& parent = std::filesystem::temp_directory_path())
    {
        std::string name = (parent / "platform-XXXXXX").string();
        path = mkdtemp(name.data());
    }
    ~TemporaryDirectory() { std::filesystem::remove_all(path); }
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;

    [[nodiscard]] std::filesystem::path operator/(std::string_view name) const { return path / name; }

    std::filesystem::path path;
};

/// Writes a file as an editor does, in place.
inline void writeFile(const std::filesystem::path& path, std::string_view contents)
{
    std::ofstream(path, std::ios::binary) << contents;
}

/// The permission bits of a file; 0 if there is none.
inline unsigned modeOf(const std::filesystem::path& path)
{
    std::error_code none;
    const auto status = std::filesystem::status(path, none);
    return std::filesystem::exists(status) ? static_cast<unsigned>(status.permissions()) : 0;
}

/// Dispatches the loop until `done`; false where that takes more than ten seconds.
template <class Done> bool runUntil(RunLoop& loop, Done done)
{
    for (int i = 0; i < 1000 && !done(); ++i) loop.runOnce(std::chrono::milliseconds(10));
    return done();
}

} // namespace platform::test
