#include "platform/device/ProcessIdentity.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <string_view>
#include <unistd.h>

#include <fmt/format.h>
#include <systemd/sd-login.h>

#include "platform/files/Files.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumPath = 4096;
constexpr std::size_t kMaximumInfo = 64u << 10;

/// Returns the contents of a small file in /proc; empty if it can't be read.
std::string contentsOf(const std::string& path)
{
    const FileHandle file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW));
    std::string contents;
    std::array<char, 4096> chunk;
    ssize_t count = 0;
    while (file && contents.size() < kMaximumInfo && (count = read(file.fd(), chunk.data(), chunk.size())) > 0)
        contents.append(chunk.data(), static_cast<std::size_t>(count));
    return contents;
}

class SystemProcesses final : public ProcessIdentity {
public:
    std::optional<std::string> applicationId(pid_t pid) override
    {
        if (auto name = flatpakName(contentsOf(fmt::format("/proc/{}/root/.flatpak-info", pid)))) return name;
        char* unit = nullptr;
        if (sd_pid_get_user_unit(pid, &unit) < 0) return std::nullopt;
        const std::unique_ptr<char, decltype(&free)> owner(unit, free);
        return applicationOfUnit(unit);
    }

    Result<std::string> executablePath(pid_t pid) override
    {
        std::array<char, kMaximumPath> path;
        const ssize_t length = readlink(fmt::format("/proc/{}/exe", pid).c_str(), path.data(), path.size());
        if (length < 0) return std::unexpected(Error::posix(errno));
        std::string result(path.data(), static_cast<std::size_t>(length));
        // The kernel appends this if the executable was removed or replaced, for example by an update.
        if (constexpr std::string_view kReplaced = " (deleted)"; result.ends_with(kReplaced))
            result.resize(result.size() - kReplaced.size());
        return result;
    }
};

} // namespace

std::optional<std::string> flatpakName(std::string_view info)
{
    bool inApplication = false;
    while (!info.empty()) {
        const std::string_view line = info.substr(0, info.find('\n'));
        info.remove_prefix(std::min(line.size() + 1, info.size()));
        if (line.starts_with('['))
            inApplication = line == "[Application]";
        else if (inApplication && line.starts_with("name=") && line.size() > 5)
            return std::string(line.substr(5));
    }
    return std::nullopt;
}

std::optional<std::string> applicationOfUnit(std::string_view unit)
{
    // app[-LAUNCHER]-ID[-RANDOM].scope, app[-LAUNCHER]-ID[@RANDOM].service; "-" in the id is escaped as "\x2d".
    if (!unit.starts_with("app-")) return std::nullopt;
    const bool scope = unit.ends_with(".scope");
    if (!scope && !unit.ends_with(".service")) return std::nullopt;
    unit = unit.substr(4, unit.rfind('.') - 4);
    if (scope) unit = unit.substr(0, unit.rfind('-'));
    unit = unit.substr(0, unit.find('@'));
    unit.remove_prefix(unit.rfind('-') + 1);

    std::string id(unit);
    constexpr std::string_view kDash = "\\x2d";
    for (std::size_t at = id.find(kDash); at != std::string::npos; at = id.find(kDash, at + 1))
        id.replace(at, kDash.size(), "-");
    return id.empty() ? std::nullopt : std::optional(std::move(id));
}

std::unique_ptr<ProcessIdentity> makeProcessIdentity()
{
    return std::make_unique<SystemProcesses>();
}

} // namespace platform
