#pragma once

#include <filesystem>
#include <functional>
#include <memory>

namespace platform {

class RunLoop;

/// Watches one path by inotify, so that it is seen when the file is made, written, replaced or removed. The directory
/// is watched, not the file; while that is missing, its nearest parent is. A path that ends in "/" stands for
/// everything that is directly in that directory.
///
/// All watches of a run loop share one inotify instance. If the system has none left, a line is logged and changes go
/// unseen. Made and destroyed on the run loop's thread; `changed` is called there, once for a burst of changes.
class FileWatch {
public:
    FileWatch(RunLoop& runLoop, std::filesystem::path path, std::function<void()> changed);
    ~FileWatch();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
