#pragma once

#include <memory>
#include <string>

namespace platform {

struct Device;
class RunLoop;

/// The names that the device is used by.
struct DeviceNames {
    std::string service;         ///< name of files and directories in the user's directories: "com.example.service"
    std::string sharedSuite;     ///< name of the user defaults shared with clients
    std::string objectPath;      ///< path of the object that posts notify signals
    std::string notifyInterface; ///< the D-Bus interface of these signals
    std::string etc = "/etc";    ///< where locale, time zone and keyboard are read
};

/// The real device. Creating it reads the user defaults, the counters and the directory of sockets; other parts connect
/// and read on first use. A missing facility behaves as its header says. Create it on the main thread before other
/// threads start; it lives as long as the process.
class SystemDevice {
public:
    /// The run loop must outlive it. Raises the process's soft limit of open files to the hard limit.
    SystemDevice(RunLoop& runLoop, const DeviceNames& names);
    ~SystemDevice();
    [[nodiscard]] Device& device();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
