#pragma once

#include <memory>
#include <string>

namespace platform {

struct Device;
class RunLoop;

/// The real device. Nothing is scanned, connected or read before it is asked for; absent facilities behave as their
/// headers say. Made on the main thread before any other; lives as long as the process.
class SystemDevice {
public:
    /// `name` names the daemon's files and folders in the user's directories, `sharedSuite` the defaults shared with
    /// clients. The run loop must outlive it. The process may open as many files as the system lets it.
    SystemDevice(RunLoop& runLoop, const std::string& name, const std::string& sharedSuite);
    ~SystemDevice();
    [[nodiscard]] Device& device();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
