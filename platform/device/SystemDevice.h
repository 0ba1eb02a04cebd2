#pragma once

#include <memory>
#include <string>

namespace platform {

struct Device;
class RunLoop;

/// The names by which the device knows the service.
struct DeviceNames {
    std::string service;         ///< of its files and folders in the user's directories: "com.example.service"
    std::string sharedSuite;     ///< of the user defaults shared with clients
    std::string objectPath;      ///< of the object that posts notify signals
    std::string notifyInterface; ///< the D-Bus interface of these signals
};

/// The real device. Scans, connects and reads nothing before it is asked to; absent facilities behave as their headers
/// say. Made on the main thread before any other thread; lives as long as the process.
class SystemDevice {
public:
    /// The run loop must outlive it. Raises the process's limit of open files as far as the system allows.
    SystemDevice(RunLoop& runLoop, const DeviceNames& names);
    ~SystemDevice();
    [[nodiscard]] Device& device();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
