#include "platform/files/FileWatch.h"

#include <cstring>
#include <sys/inotify.h>
#include <utility>

#include <systemd/sd-event.h>

#include "platform/base/Log.h"
#include "platform/run/RunLoop.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr std::uint32_t kChanges =
    IN_CREATE | IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr std::uint32_t kLosses = IN_DELETE_SELF | IN_MOVE_SELF | IN_IGNORED | IN_UNMOUNT;

} // namespace

/// Notes each event, and evaluates them once no further event is pending.
struct FileWatch::Impl {
    Impl(sd_event* loop_, fs::path path_, std::function<void()> changed_)
        : loop(loop_), path(std::move(path_)), changed(std::move(changed_))
    {
        const auto look = [](sd_event_source*, void* self) {
            static_cast<Impl*>(self)->look();
            return 0;
        };
        if (sd_event_add_defer(loop, &later, look, this) < 0) return; // out of memory
        sd_event_source_set_enabled(later, SD_EVENT_OFF);
        sd_event_source_set_priority(later, SD_EVENT_PRIORITY_NORMAL + 1); // after all pending events
        aim();
    }
    ~Impl()
    {
        sd_event_source_disable_unref(events);
        sd_event_source_disable_unref(later);
    }

    sd_event* loop;
    fs::path path;
    std::function<void()> changed;
    fs::path watched;                  // the directory
    sd_event_source* events = nullptr; // of that directory
    sd_event_source* later = nullptr;
    // Events since the last evaluation.
    bool mine = false;      // of the path
    bool elsewhere = false; // of a parent: the directory may exist now
    bool lost = false;      // the watched directory was removed or moved, and possibly replaced

    [[nodiscard]] fs::path folder() const { return path.parent_path(); }

    /// Returns the file's directory, or its nearest existing parent.
    [[nodiscard]] fs::path nearest() const
    {
        fs::path found = folder();
        std::error_code ignored;
        while (!fs::is_directory(found, ignored) && found.has_relative_path()) found = found.parent_path();
        return found;
    }

    /// Watches the nearest directory. Repeats until it doesn't change: a nearer one may have been created meanwhile.
    void aim()
    {
        for (fs::path next = nearest(); next != watched; next = nearest()) {
            letGo();
            watched = next;
            const auto note = [](sd_event_source*, const inotify_event* event, void* self) {
                static_cast<Impl*>(self)->note(*event);
                return 0;
            };
            if (const int added = sd_event_add_inotify(loop, &events, next.c_str(), kChanges, note, this); added < 0)
                defaultLog().error("cannot watch {}, its changes are not noticed: {}", path.string(),
                                   std::strerror(-added));
        }
    }

    void letGo()
    {
        events = sd_event_source_disable_unref(events);
        watched.clear();
    }

    void note(const inotify_event& event)
    {
        if ((event.mask & IN_Q_OVERFLOW) != 0)
            mine = true;
        else if ((event.mask & kLosses) != 0)
            lost = true;
        else if (event.len > 0 && (path.has_filename() ? watched / event.name == path : watched == folder()))
            mine = true;
        else if (event.len == 0 || watched != folder())
            elsewhere = true;
        if (mine || elsewhere || lost) sd_event_source_set_enabled(later, SD_EVENT_ONESHOT);
    }

    void look()
    {
        if (elsewhere || lost) {
            const fs::path before = watched;
            if (lost) letGo();
            aim();
            mine = mine || ((lost || before != watched) && (before == folder() || watched == folder()));
        }
        elsewhere = lost = false;
        if (std::exchange(mine, false)) changed();
    }
};

FileWatch::FileWatch(RunLoop& runLoop, fs::path path, std::function<void()> changed)
    : _impl(std::make_unique<Impl>(runLoop.handle(), std::move(path), std::move(changed)))
{}

FileWatch::~FileWatch() = default;

} // namespace platform
