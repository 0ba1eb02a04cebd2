#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

#include "platform/values/Error.h"

namespace platform {

/// Who a process is, read from /proc. The answers are the peer's own claims at that moment: good for logs and
/// counters, not for granting rights. Any thread.
class ProcessIdentity {
public:
    virtual ~ProcessIdentity() = default;
    /// The application id: the "name" of a Flatpak instance, else the application of its systemd scope or service
    /// ("app-…-ID-….scope"). Nothing if it has neither.
    [[nodiscard]] virtual std::optional<std::string> applicationId(pid_t pid) = 0;
    /// The path of its executable, 4096 bytes at most.
    [[nodiscard]] virtual Result<std::string> executablePath(pid_t pid) = 0;
};

[[nodiscard]] std::unique_ptr<ProcessIdentity> makeProcessIdentity();

/// The application's name in the text of a .flatpak-info file.
[[nodiscard]] std::optional<std::string> flatpakName(std::string_view info);
/// The application id in the name of the systemd unit that its launcher made: "app-gnome-org.example.App-12.scope".
[[nodiscard]] std::optional<std::string> applicationOfUnit(std::string_view unit);

} // namespace platform
