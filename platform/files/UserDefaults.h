#pragma once

#include <cstdint>
#include <filesystem>
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

/// Small persistent settings: one suite, one JSON file that maps keys to values. Any thread.
///
/// A key has the file's value, else its registered default, else null. The file may be edited or replaced while the
/// process runs; `watch` reads it again. If it isn't a JSON object or too large, the error is logged and the suite is
/// empty until the file is replaced; the next write renames such a file to "NAME.corrupt". If a read or write fails
/// for a reason that may pass, the values stay as they were, and both are tried again after a second, then twice as
/// long, up to a minute.
///
/// Readers see `set` at once. It is written soon, atomically, together with other keys set by then; keys that others
/// changed in the file are kept. A kill may lose values that `synchronize` hasn't written.
///
/// A writer holds a lock on the file "NAME.lock". Nobody waits for it: while another process holds it, a write is
/// delayed by up to two seconds, then done without it. `synchronize` doesn't delay.
class UserDefaults {
public:
    /// Reads the suite at `path`. `writeQueue` (serial) runs the writes. `files` must outlive the queue's work.
    UserDefaults(FileSystem& files, std::filesystem::path path, std::shared_ptr<Queue> writeQueue);
    /// Creates a suite in memory only.
    UserDefaults();
    ~UserDefaults();
    UserDefaults(const UserDefaults&) = delete;
    UserDefaults& operator=(const UserDefaults&) = delete;

    /// Adds values for keys that the file doesn't have.
    void registerDefaults(const Dictionary& defaults);

    [[nodiscard]] Value value(std::string_view key) const;
    /// Returns true for true, a number other than 0, and the texts "true", "yes" and "1" in any case; false otherwise.
    [[nodiscard]] bool boolean(std::string_view key) const;
    /// Returns a non-empty string, or nothing.
    [[nodiscard]] std::optional<std::string> string(std::string_view key) const;
    /// Returns a whole number or a text that contains one; nothing otherwise.
    [[nodiscard]] std::optional<std::int64_t> integer(std::string_view key) const;
    /// Converts a number from seconds since 1970, the form in which `set` stores dates.
    [[nodiscard]] std::optional<Date> date(std::string_view key) const;

    /// Stores dates as seconds since 1970. Null removes the key.
    void set(std::string_view key, Value value);
    void remove(std::string_view key) { set(key, Value()); }
    /// Writes pending values before it returns. Logs and returns a failure.
    Result<void> synchronize();
    /// Reads the file again.
    void reload();
    /// Returns the file's values without registered defaults, for diagnostics.
    [[nodiscard]] Dictionary contents() const;

    /// Reads the file again after each change, until this object is destroyed. Call it, and destroy this object, on the
    /// run loop's thread.
    void watch(RunLoop& runLoop);

private:
    struct Impl;
    std::shared_ptr<Impl> _impl;
};

} // namespace platform
