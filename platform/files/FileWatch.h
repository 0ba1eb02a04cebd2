#pragma once

#include <filesystem>
#include <functional>
#include <memory>

namespace platform {

class RunLoop;

/// Calls `changed` after a file was created, written, replaced or removed. Uses inotify on the file's directory; while
/// that is missing, on its nearest existing parent. A path that ends in "/" selects all entries of that directory.
///
/// All watches of a run loop share one inotify instance. If inotify fails (the system's limits), logs an error and
/// reports no changes. Create and destroy on the run loop's thread, where `changed` runs, once for a burst of changes;
/// the run loop must outlive the watch.
class FileWatch {
public:
    FileWatch(RunLoop& runLoop, std::filesystem::path path, std::function<void()> changed);
    ~FileWatch();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
