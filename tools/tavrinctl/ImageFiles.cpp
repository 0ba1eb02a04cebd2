#include "tools/tavrinctl/ImageFiles.h"

#include <cerrno>

#include <fmt/format.h>

#include "platform/files/Files.h"
#include "platform/net/Url.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

constexpr std::size_t kLongestName = 80;
constexpr int kMostOfOneName = 10'000;

struct Type {
    std::string_view name, ending;
};
constexpr Type kTypes[]{{"png", ".png"}, {"jpeg", ".jpg"}, {"gif", ".gif"}, {"webp", ".webp"}, {"svg", ".svg"}};

bool isPlain(char c)
{
    return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '.' || c == '-' ||
           c == '_';
}

} // namespace

std::string_view imageType(std::string_view bytes)
{
    if (bytes.starts_with("\x89PNG\r\n\x1a\n")) return "png";
    if (bytes.starts_with("\xff\xd8\xff")) return "jpeg";
    if (bytes.starts_with("GIF8")) return "gif";
    if (bytes.starts_with("RIFF") && bytes.substr(0, 12).ends_with("WEBP")) return "webp";
    const std::string_view start = bytes.substr(0, 512);
    if (start.contains("<svg")) return "svg";
    if (start.contains("<html") || start.contains("<!DOCTYPE html") || start.contains("<!doctype html")) return "html";
    return "";
}

std::string imageFileName(std::string_view urlOrIdentifier, std::string_view type)
{
    const auto url = platform::Url::parse(urlOrIdentifier);
    std::string text = platform::percentDecode(url ? url->path() : std::string(urlOrIdentifier));
    while (text.ends_with('/')) text.pop_back();
    if (url) text.erase(0, text.rfind('/') + 1);
    std::string name;
    for (const char c : text) {
        const char kept = isPlain(c) ? c : '_';
        if (kept == '_' && name.ends_with('_')) continue; // one for a run of them or a multi-byte character
        if (kept == '.' && name.empty()) continue;
        name += kept;
        if (name.size() == kLongestName) break;
    }
    if (name.empty()) name = "image";
    for (const Type& each : kTypes)
        if (each.name == type && !name.ends_with(each.ending)) name += each.ending;
    return name;
}

std::filesystem::path saveImage(platform::FileSystem& files, const std::filesystem::path& directory,
                                const std::string& name, const platform::Bytes& image,
                                std::set<std::filesystem::path>& taken)
{
    const std::filesystem::path plain(name);
    for (int number = 1; number < kMostOfOneName; ++number) {
        const std::string numbered =
            number == 1 ? name : fmt::format("{}-{}{}", plain.stem().string(), number, plain.extension().string());
        std::filesystem::path path = directory / numbered;
        if (taken.contains(path)) continue;
        auto file = files.createForAppending(path);
        if (!file && file.error().code == EEXIST) {
            const auto there = files.read(path, image.size());
            if (!there || *there != image) continue;
        } else if (!file) {
            throw Failure(fmt::format("can't write {}: choose another directory with -o", file.error().reason()));
        } else if (const auto written = (*file)->append({image.view()}); !written) {
            (void)files.remove(path);
            throw Failure(fmt::format("can't write {}: {}", path.string(), written.error().reason()));
        }
        taken.insert(path);
        return path;
    }
    throw Failure(fmt::format("{} already has {} files named {}: choose another directory with -o", directory.string(),
                              kMostOfOneName, name));
}

} // namespace tavrin::ctl
