#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/base/Date.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform {

class FileSystem;
class Queue;
class RunLoop;

/// Small persistent settings: one suite, one JSON file, a dictionary of keys to values. Any thread.
///
/// A key reads as what the file has, else as its registered default, else as null. The file may be edited or
/// replaced while the process runs: it is watched, and read again. A file that can't be read or isn't a JSON object
/// is logged and reads as empty until it is replaced; it is not overwritten before something is set.
///
/// set() is seen by readers at once and written soon, atomically, together with what else was set by then; keys that
/// others changed in the file meanwhile are kept. A process that is killed may lose what synchronize() hasn't written.
///
/// Whoever writes holds a lock on the file's name with ".lock" behind it. Nobody waits for it: while another process
/// has it, a write is put off for up to two seconds; then, and in synchronize() at once, it is done without.
class UserDefaults {
public:
    /// A suite kept at `path`. `writeQueue` (serial) runs the writes.
    UserDefaults(FileSystem& files, std::filesystem::path path, std::shared_ptr<Queue> writeQueue);
    /// A suite in memory only.
    UserDefaults();
    ~UserDefaults();
    UserDefaults(const UserDefaults&) = delete;
    UserDefaults& operator=(const UserDefaults&) = delete;

    /// Values for keys that the file doesn't have. Adds to those registered before.
    void registerDefaults(const Dictionary& defaults);

    [[nodiscard]] Value value(std::string_view key) const;
    /// True for true, a number other than 0, and the texts "true", "yes" and "1" in any case; else false.
    [[nodiscard]] bool boolean(std::string_view key) const;
    /// A non-empty string; nothing for anything else.
    [[nodiscard]] std::optional<std::string> string(std::string_view key) const;
    /// A whole number, or a text that is one.
    [[nodiscard]] std::optional<std::int64_t> integer(std::string_view key) const;
    /// Seconds since 1970, as set(key, Date) writes them.
    [[nodiscard]] std::optional<Date> date(std::string_view key) const;

    /// Dates are kept as seconds since 1970. A null removes the key.
    void set(std::string_view key, Value value);
    void remove(std::string_view key) { set(key, Value()); }
    /// Writes what was set, now. Failures are logged and returned, and tried again with the next write.
    Result<void> synchronize();
    /// Reads the file again, as the watch does.
    void reload();
    /// What the file has (without registered defaults), for diagnostics.
    [[nodiscard]] Dictionary contents() const;

    /// Watches the file from the run loop's thread until destroyed.
    void watch(RunLoop& runLoop);

private:
    struct Impl;
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
