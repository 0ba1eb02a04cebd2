#include "platform/FileWatch.h"

#include <array>
#include <cerrno>
#include <sys/epoll.h>
#include <sys/inotify.h>
#include <unistd.h>

#include "platform/Files.h"
#include "platform/RunLoop.h"

namespace platform {

namespace fs = std::filesystem;

struct FileWatch::Impl {
    fs::path path;
    std::function<void()> changed;
    FileHandle inotify{inotify_init1(IN_CLOEXEC | IN_NONBLOCK)};
    int directory = -1; // inotify's number for the directory that is watched
    fs::path watched;   // that directory
    std::unique_ptr<RunLoop::Watch> watch;

    [[nodiscard]] fs::path folder() const { return path.parent_path(); }

    /// Watches the file's directory, or the nearest parent that is there.
    void aim()
    {
        fs::path nearest = folder();
        std::error_code ignored;
        while (!fs::is_directory(nearest, ignored) && nearest.has_relative_path()) nearest = nearest.parent_path();
        if (nearest == watched) return;
        if (directory >= 0) inotify_rm_watch(inotify.fd(), directory);
        watched = nearest;
        directory = inotify_add_watch(inotify.fd(), nearest.c_str(),
                                      IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE |
                                          IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR);
    }

    void readEvents()
    {
        alignas(inotify_event) std::array<char, 4096> buffer;
        bool mine = false;
        bool elsewhere = false;
        ssize_t size = 0;
        while ((size = read(inotify.fd(), buffer.data(), buffer.size())) > 0) {
            for (ssize_t at = 0; at < size;) {
                const auto* event = reinterpret_cast<const inotify_event*>(buffer.data() + at);
                if (event->len > 0 && (path.has_filename() ? watched / event->name == path : watched == folder()))
                    mine = true;
                else if (event->len == 0 || watched != folder())
                    elsewhere = true;
                at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
            }
        }
        if (elsewhere) {
            const fs::path before = watched;
            if (!fs::exists(watched)) watched.clear();
            aim();
            mine = mine || (before != watched && (before == folder() || watched == folder()));
        }
        if (mine) changed();
    }
};

FileWatch::FileWatch(RunLoop& runLoop, fs::path path, std::function<void()> changed) : _impl(std::make_unique<Impl>())
{
    _impl->path = std::move(path);
    _impl->changed = std::move(changed);
    if (!_impl->inotify) return; // out of instances: changes go unseen
    _impl->aim();
    _impl->watch =
        runLoop.watch(_impl->inotify.fd(), EPOLLIN, [impl = _impl.get()](std::uint32_t) { impl->readEvents(); });
}

FileWatch::~FileWatch() = default;

} // namespace platform
