#pragma once

#include <filesystem>
#include <set>
#include <string>
#include <string_view>

#include "platform/base/Bytes.h"

namespace platform {
class FileSystem;
}

namespace tavrin::ctl {

/// Detects the type from the first bytes: "png", "jpeg", "gif", "webp", "svg", or "html" for a page instead of an
/// image. Returns an empty string for anything else.
[[nodiscard]] std::string_view imageType(std::string_view bytes);

/// Makes a file name from an image's URL (the last part of its path) or identifier, and its type. Safe for any input:
/// at most 80 ASCII letters, digits, ".", "-" and "_" without a leading ".", followed by the type's suffix.
[[nodiscard]] std::string imageFileName(std::string_view urlOrIdentifier, std::string_view type);

/// Saves an image in an existing directory as a new file with mode 0600, and returns its path. Never overwrites: an
/// existing file with the same bytes is returned, and any other one, or a path in `taken`, makes the name get a number.
/// Adds the returned path to `taken`. Throws `Failure` if writing fails.
[[nodiscard]] std::filesystem::path saveImage(platform::FileSystem& files, const std::filesystem::path& directory,
                                              const std::string& name, const platform::Bytes& image,
                                              std::set<std::filesystem::path>& taken);

} // namespace tavrin::ctl
