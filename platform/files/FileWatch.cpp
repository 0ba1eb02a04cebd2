#include "platform/files/FileWatch.h"

#include <array>
#include <cerrno>
#include <sys/epoll.h>
#include <sys/inotify.h>
#include <unistd.h>

#include "platform/files/Files.h"
#include "platform/run/RunLoop.h"

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

    /// The file's directory, or the nearest parent that is there.
    [[nodiscard]] fs::path nearest() const
    {
        fs::path found = folder();
        std::error_code ignored;
        while (!fs::is_directory(found, ignored) && found.has_relative_path()) found = found.parent_path();
        return found;
    }

    /// Watches that one. Looks again once it does, for what was made in between.
    void aim()
    {
        for (fs::path next = nearest(); next != watched; next = nearest()) {
            letGo();
            watched = next;
            directory = inotify_add_watch(inotify.fd(), next.c_str(),
                                          IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE |
                                              IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR);
        }
    }

    void letGo()
    {
        if (directory >= 0) inotify_rm_watch(inotify.fd(), directory);
        directory = -1;
        watched.clear();
    }

    void readEvents()
    {
        alignas(inotify_event) std::array<char, 4096> buffer;
        bool mine = false;
        bool elsewhere = false;
        bool lost = false; // the directory: removed, or moved, and perhaps another is in its place by now
        ssize_t size = 0;
        while ((size = read(inotify.fd(), buffer.data(), buffer.size())) > 0) {
            const inotify_event* event = nullptr;
            for (ssize_t at = 0; at < size; at += static_cast<ssize_t>(sizeof(inotify_event) + event->len)) {
                event = reinterpret_cast<const inotify_event*>(buffer.data() + at);
                if ((event->mask & IN_Q_OVERFLOW) != 0)
                    mine = true;
                else if (event->wd != directory)
                    continue; // it is still told of an earlier one
                else if ((event->mask & (IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT)) != 0)
                    lost = true;
                else if (event->len > 0 && (path.has_filename() ? watched / event->name == path : watched == folder()))
                    mine = true;
                else if (event->len == 0 || watched != folder())
                    elsewhere = true;
            }
        }
        if (elsewhere || lost) {
            const fs::path before = watched;
            if (lost) letGo();
            aim();
            mine = mine || ((lost || before != watched) && (before == folder() || watched == folder()));
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
