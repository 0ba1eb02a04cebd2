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

/// Kept answers on disk: a directory (0700) with an index, a SQLite database that also has the small bodies, and one
/// file (0600) for each of the others. One thread at a time.
///
/// The directory belongs to one process, by a lock. Nothing is synced: what a power cut leaves is found to be damaged,
/// or missing, when it is read. What is damaged is logged and dropped, be it one answer or the index with all of them.
/// Files that belong to no answer are removed when the directory is opened.
class HttpCacheStore {
public:
    struct Limits {
        std::uint64_t capacity = 0;        ///< bytes of all answers; past it those go that were used least recently
        std::size_t minimumMappedSize = 0; ///< bodies of so many bytes are files of their own
    };

    /// Opens or makes it; `files` must outlive it. Fails with EWOULDBLOCK while another process has it open.
    [[nodiscard]] static Result<std::unique_ptr<HttpCacheStore>>
    open(FileSystem& files, const std::filesystem::path& directory, const Limits& limits);
    /// Notes what was used.
    ~HttpCacheStore();

    /// Of all answers, in no order.
    [[nodiscard]] Result<std::vector<std::string>> keys();
    /// Null where there is none, or it is damaged. An answer whose URL is `likely`, too, needn't parse it.
    [[nodiscard]] Result<std::shared_ptr<const StoredResponse>> find(const std::string& key, const Url& likely = {});
    /// Keeps the answer in place of an earlier one; answers the keys of those that had to go for it.
    [[nodiscard]] Result<std::vector<std::string>> put(const std::string& key, const StoredResponse& stored);
    [[nodiscard]] Result<void> remove(const std::string& key);
    /// It was used elsewhere.
    void noteUse(const std::string& key);

    /// False once someone took the directory or the index away.
    [[nodiscard]] bool isInPlace() const;
    /// Removes all and begins with an empty index.
    [[nodiscard]] Result<void> beginAnew();

private:
    struct Row;
    struct Mapping {
        std::int64_t id;
        std::uint64_t number; ///< of the file that is mapped
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
    /// Forgets the entries; their files go with `removeBody`, once that has been committed.
    [[nodiscard]] Result<void> forget(const std::vector<std::int64_t>& ids);
    [[nodiscard]] Result<void> saveUses();

    FileSystem& _files;
    const std::filesystem::path _directory;
    const Limits _limits;
    const FileHandle _lock; // the directory is this process's while it lives
    std::optional<Sqlite> _index;
    std::uint64_t _indexNumber = 0; // of the index's file
    std::uint64_t _size = 0;        // of all entries
    std::int64_t _lastUse = 0;
    std::map<std::string, std::int64_t> _uses; // not in the index yet
    std::list<Mapping> _mappings;              // of the bodies found last, the latest first
};

} // namespace platform
