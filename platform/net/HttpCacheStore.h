#pragma once

#include <cstdint>
#include <filesystem>
#include <list>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/files/Files.h"
#include "platform/files/Sqlite.h"
#include "platform/net/HttpCachePolicy.h"

namespace platform {

/// Cached responses on disk: a directory (0700) with a SQLite index, which also has the small bodies, and one file
/// (0600) for each larger body. docs/formats.md describes the format. One thread at a time.
///
/// One process at a time: the store holds a lock on the directory. Bodies are not synced: a digest reveals a response
/// that a power cut damaged when it is read. A damaged response is logged and dropped; a damaged index is dropped with
/// all responses. Opening removes files without an entry.
class HttpCacheStore {
public:
    struct Limits {
        std::uint64_t capacity = 0;        ///< bytes of all responses; beyond it the least recently used are evicted
        std::size_t minimumMappedSize = 0; ///< bodies of at least this many bytes are separate files
    };

    /// Opens or creates a store; `files` must outlive it. Fails with EWOULDBLOCK if another process has it open.
    [[nodiscard]] static Result<std::unique_ptr<HttpCacheStore>>
    open(FileSystem& files, const std::filesystem::path& directory, const Limits& limits);
    /// Saves pending uses.
    ~HttpCacheStore();

    /// Returns the keys of all responses, unordered.
    [[nodiscard]] Result<std::vector<std::string>> keys();
    /// Returns null if the response is missing or damaged. If its URL equals `likely`, the URL is not parsed again.
    [[nodiscard]] Result<std::shared_ptr<const StoredResponse>> find(const std::string& key, const Url& likely = {});
    /// Stores a response in place of an earlier one; returns the keys that were evicted for it.
    [[nodiscard]] Result<std::vector<std::string>> put(const std::string& key, const StoredResponse& stored);
    [[nodiscard]] Result<void> remove(const std::string& key);
    /// Records a use of a response that was served from memory.
    void noteUse(const std::string& key);

    /// Returns false if the directory or the index has been removed or replaced.
    [[nodiscard]] bool isInPlace() const;
    /// Removes everything and creates an empty index.
    [[nodiscard]] Result<void> reset();

private:
    struct Row;
    struct Mapping {
        std::int64_t id;
        std::uint64_t number; ///< inode of the mapped file
        Bytes body;
    };
    HttpCacheStore(FileSystem& files, std::filesystem::path directory, const Limits& limits, FileHandle lock)
        : _files(files), _directory(std::move(directory)), _limits(limits), _lock(std::move(lock))
    {}
    [[nodiscard]] std::filesystem::path bodyPath(std::int64_t id) const;
    [[nodiscard]] Result<void> openIndex();
    [[nodiscard]] Result<void> sweep();
    [[nodiscard]] std::optional<Bytes> mapBody(std::int64_t id, std::uint64_t size);
    void removeBody(std::int64_t id);
    /// Deletes the entries. Call `removeBody` for each after the commit.
    [[nodiscard]] Result<void> forget(const std::vector<std::int64_t>& ids);
    [[nodiscard]] Result<void> saveUses();

    FileSystem& _files;
    const std::filesystem::path _directory;
    const Limits _limits;
    const FileHandle _lock; // reserves the directory for this process
    std::optional<Sqlite> _index;
    std::uint64_t _indexNumber = 0; // inode of the index
    std::uint64_t _size = 0;        // bytes of all entries
    std::int64_t _lastUse = 0;
    std::map<std::string, std::int64_t> _uses; // pending ones
    std::list<Mapping> _mappings;              // most recently used first
};

} // namespace platform
