#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <sys/types.h>
#include <vector>

#include "tests/support/TemporaryDirectory.h"

namespace platform::test {

/// A directory that remembers each system call that changes it, and can be put back as a power cut after any of them
/// may have left it. The calls of everybody are seen, SQLite's too: this program has its own open, write, rename, fsync
/// and so on, which note what they did here.
///
/// What survives a cut:
///
/// | Survives | After |
/// |---|---|
/// | contents and size of a file | fsync or fdatasync of the file; its name does not |
/// | the entries of a directory, files and directories | fsync of the directory |
/// | anything else | by luck: each entry, each page of 4 KiB and each size on its own, as it was at any moment since
/// the sync |
///
/// A page that was never written reads as zeros, or as what its block had before. Three assumptions go beyond POSIX: a
/// page is written as a whole; a rename is one change, so that the new name has the old or the new file, and the file
/// has one of its names; the sync of either directory of a rename makes it durable.
///
/// One thread; one at a time.
class RecordedDisk {
public:
    RecordedDisk();
    ~RecordedDisk();
    RecordedDisk(const RecordedDisk&) = delete;
    RecordedDisk& operator=(const RecordedDisk&) = delete;

    /// What is below the directory: relative path to contents; nothing for a directory.
    using Image = std::map<std::string, std::optional<std::string>>;
    /// What of the unsynced survives.
    struct Luck {
        enum class Kind {
            Nothing,
            Everything,
            Names,         ///< all changes of directories
            NamesAndSizes, ///< and the sizes of files, whose new pages are zeros
            Contents,      ///< all of files, but no change of a directory
            AllBut,        ///< one change of a directory, the `number`-th from the end
            Only,          ///< of the changes of directories; and all contents
            Chance,        ///< with `number` as seed
        };
        Kind kind;
        unsigned number;
    };

    /// No change from here on is remembered.
    void stop();
    /// The number of changes and syncs so far.
    [[nodiscard]] std::size_t calls() const { return _calls.size(); }
    /// Whether a call changes the contents of a file, and not only a directory or what is durable.
    [[nodiscard]] bool changesContents(std::size_t call) const;
    /// The call, for messages.
    [[nodiscard]] std::string describe(std::size_t call) const;
    [[nodiscard]] Image after(std::size_t calls, Luck luck) const;
    /// The number of unsynced changes of directories.
    [[nodiscard]] std::size_t atStake(std::size_t calls) const { return std::ranges::count(isDurable(calls), false); }
    /// Reads the directory.
    [[nodiscard]] Image now() const;
    /// Replaces all that is in the directory.
    void put(const Image& image) const;

    const TemporaryDirectory directory{"/dev/shm"}; ///< inodes are never reused there
    const std::filesystem::path& root = directory.path;

    // For the system calls.
    void changeEntries(const char* removed, const char* added);
    void write(int file, off_t offset, std::string data);
    void truncate(int file, off_t size);
    void sync(int fileOrDirectory);

private:
    using Node = ino_t;
    struct Place {
        Node directory;
        std::string name;
        auto operator<=>(const Place&) const = default;
    };
    struct Call {
        enum class Kind { Entries, Write, Truncate, Sync };
        Kind kind;
        Node node = 0;
        std::optional<Place> removed, added; ///< of Entries
        std::size_t offset = 0;              ///< of Write; the size, of Truncate
        std::string data;
    };
    class Dice;
    void noteCall(int file, Call call);
    [[nodiscard]] std::optional<Place> placeOf(const char* path) const;
    [[nodiscard]] std::optional<Node> nodeOf(int file) const;
    /// For each call that changes directories, in their order.
    [[nodiscard]] std::vector<bool> isDurable(std::size_t calls) const;
    [[nodiscard]] std::string contentsOf(Node node, std::size_t calls, Dice& dice) const;

    dev_t _device = 0;
    Node _root = 0;
    std::map<Node, std::string> _nodes; ///< with their first paths
    std::map<Node, bool> _isDirectory;
    std::vector<Call> _calls;
    std::map<Node, std::vector<std::size_t>> _callsOf; ///< those that change or sync contents
};

} // namespace platform::test
