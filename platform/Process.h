#pragma once

#include <optional>
#include <string>
#include <sys/types.h>

#include "platform/Error.h"

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

} // namespace platform
