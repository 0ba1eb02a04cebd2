#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

#include "platform/values/Error.h"

namespace platform {

/// Identifies processes by /proc. A process can influence the results: use them for logs and counters, not for granting
/// rights. Any thread.
class ProcessIdentity {
public:
    virtual ~ProcessIdentity() = default;
    /// Returns the application id: the "name" of a Flatpak instance, else the application of the process's systemd
    /// scope or service ("app-…-ID-….scope"); nothing if the process has neither.
    [[nodiscard]] virtual std::optional<std::string> applicationId(pid_t pid) = 0;
    /// Returns the path of the executable, cut at 4096 bytes. Fails with ENOENT if the process doesn't exist.
    [[nodiscard]] virtual Result<std::string> executablePath(pid_t pid) = 0;
};

/// Returns the implementation for the real /proc.
[[nodiscard]] std::unique_ptr<ProcessIdentity> makeProcessIdentity();

/// Returns the application's name from the text of a .flatpak-info file; nothing if it has none.
[[nodiscard]] std::optional<std::string> flatpakName(std::string_view info);
/// Returns the application id from the name of a launcher's systemd unit, "app-gnome-org.example.App-12.scope"; nothing
/// for other units.
[[nodiscard]] std::optional<std::string> applicationOfUnit(std::string_view unit);

} // namespace platform
