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
/// A lock gives the directory to one process. Nothing is synced: an answer that a power cut damaged is recognised by
/// its digest when it is read. What is damaged is logged and dropped, one answer or the index with all of them. Files
/// that belong to no answer are removed when the directory is opened.
class HttpCacheStore {
public:
    struct Limits {
        std::uint64_t capacity = 0;        ///< bytes of all answers; past it the least recently used are removed
        std::size_t minimumMappedSize = 0; ///< bodies of at least so many bytes are files of their own
    };

    /// Opens or makes it; `files` must outlive it. Fails with EWOULDBLOCK while another process has it open.
    [[nodiscard]] static Result<std::unique_ptr<HttpCacheStore>>
    open(FileSystem& files, const std::filesystem::path& directory, const Limits& limits);
    /// Saves what was used.
    ~HttpCacheStore();

    /// The keys of all answers, in no order.
    [[nodiscard]] Result<std::vector<std::string>> keys();
    /// Returns null if there is none, or it is damaged. `likely` saves parsing the answer's URL if that is the same.
    [[nodiscard]] Result<std::shared_ptr<const StoredResponse>> find(const std::string& key, const Url& likely = {});
    /// Keeps the answer in place of an earlier one; returns the keys of those that were evicted for it.
    [[nodiscard]] Result<std::vector<std::string>> put(const std::string& key, const StoredResponse& stored);
    [[nodiscard]] Result<void> remove(const std::string& key);
    /// Notes a use of the answer that this store didn't see.
    void noteUse(const std::string& key);

    /// Returns false once someone has removed the directory or the index.
    [[nodiscard]] bool isInPlace() const;
    /// Removes everything and makes an empty index.
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
