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

/// What bytes are by their first few: "png", "jpeg", "gif", "webp", "svg"; "html" for a page in an image's place; empty
/// where none of these.
[[nodiscard]] std::string_view imageType(std::string_view bytes);

/// A name for a file of an image of that type, made of its URL (the last part of its path) or its identifier. Whatever
/// those are, it is a plain name for this directory: letters, digits, ".", "-" and "_" of ASCII, none of them a leading
/// ".", 80 at most, then the type's ending.
[[nodiscard]] std::string imageFileName(std::string_view urlOrIdentifier, std::string_view type);

/// Saves an image as a new file of that name in a directory that is there, mode 0600, and answers the file. Files that
/// are there are left as they are: one that holds these bytes already is answered as if it were new, for others the
/// name gets a number. A name of `taken`, to which the answer is added, is left alone as well. A `Failure` where it
/// can't be written.
[[nodiscard]] std::filesystem::path saveImage(platform::FileSystem& files, const std::filesystem::path& directory,
                                              const std::string& name, const platform::Bytes& image,
                                              std::set<std::filesystem::path>& taken);

} // namespace tavrin::ctl
