#include "platform/net/HttpCacheStore.h"

#include <algorithm>
#include <array>
#include <charconv>

#include <fmt/format.h>
#include <sqlite3.h>
#define XXH_INLINE_ALL
#include <xxhash.h>

#include "platform/base/Log.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr const char* kIndex = "index.db";
constexpr std::string_view kBodySuffix = ".body";
/// Suffix of a body whose write a kill interrupted.
constexpr std::string_view kUnfinishedSuffix = ".tmp";
/// Estimated bytes of an entry besides its texts and body.
constexpr std::uint64_t kEntrySize = 1024;
/// Uses are saved with the next change, or when this many are pending.
constexpr std::size_t kMaximumUnsavedUses = 256;
/// Mappings are cached, at most this many and with at most these bytes together: creating one can cost far more than
/// reading it.
constexpr std::size_t kMaximumMappings = 64;
constexpr std::size_t kMostMapped = 16u << 20;

/// "entry" is separate because it is read completely when the index is opened, and written with every use.
constexpr std::array kSchema{
    "CREATE TABLE entry (id INTEGER PRIMARY KEY AUTOINCREMENT, key TEXT NOT NULL UNIQUE, size INTEGER NOT NULL,"
    " used INTEGER NOT NULL)",
    "CREATE INDEX entryByUse ON entry (used)",
    "CREATE TABLE answer (id INTEGER PRIMARY KEY, status INTEGER NOT NULL, url TEXT NOT NULL, headers TEXT NOT NULL,"
    " selecting TEXT NOT NULL, requested INTEGER NOT NULL, received INTEGER NOT NULL, public INTEGER NOT NULL,"
    " bodySize INTEGER NOT NULL, xxh3 INTEGER NOT NULL, body TEXT)"};

/// Returns header fields as lines. Leaves out a field that contains a line end, which can't have arrived by HTTP.
std::string linesOf(const HttpHeaders& headers)
{
    std::string lines;
    for (const auto& [name, value] : headers) {
        if (name.find_first_of(":\n") != std::string::npos || value.contains('\n')) continue;
        lines.append(name).append(":").append(value).append("\n");
    }
    return lines;
}

HttpHeaders headersOf(std::string_view lines)
{
    HttpHeaders headers;
    while (!lines.empty()) {
        const std::string_view line = lines.substr(0, lines.find('\n'));
        lines.remove_prefix(std::min(lines.size(), line.size() + 1));
        if (const auto colon = line.find(':'); colon != std::string_view::npos)
            headers.add(std::string(line.substr(0, colon)), std::string(line.substr(colon + 1)));
    }
    return headers;
}

/// Continues the digest `before`. XXH3 detects damage, such as pages that never reached the disk, but no manipulation.
std::uint64_t digestOf(std::string_view bytes, std::uint64_t before)
{
    return XXH3_64bits_withSeed(bytes.data(), bytes.size(), before);
}

std::int64_t countOf(Date date)
{
    return date.time_since_epoch().count();
}

Error damaged(std::string reason)
{
    return Error::withReason(kSqliteErrorDomain, Sqlite::kCorrupt, std::move(reason));
}

/// Returns the entry's number in the name of its file, or nothing for other files.
std::optional<std::int64_t> idOf(std::string_view name)
{
    if (!name.ends_with(kBodySuffix)) return std::nullopt;
    std::int64_t id = 0;
    name.remove_suffix(kBodySuffix.size());
    const char* end = name.data() + name.size();
    const auto read = std::from_chars(name.data(), end, id);
    return read.ec == std::errc() && read.ptr == end ? std::optional(id) : std::nullopt;
}

} // namespace

/// A row of the table "answer".
struct HttpCacheStore::Row {
    std::int64_t id = 0;
    std::int64_t status = 0;
    std::string url;
    std::string headers;
    std::string selecting;
    std::int64_t requested = 0;
    std::int64_t received = 0;
    std::int64_t publicPeer = kUnknown;
    std::int64_t bodySize = 0;
    std::int64_t digest = 0;
    std::optional<std::string> body;

    /// In the column "public", beside 0 and 1.
    static constexpr std::int64_t kUnknown = -1;

    [[nodiscard]] std::int64_t digestWith(const std::string& key, std::string_view bytes) const
    {
        const std::array numbers{status, requested, received, publicPeer};
        std::uint64_t digest =
            digestOf({reinterpret_cast<const char*>(numbers.data()), sizeof numbers}, numbers.size());
        for (const std::string_view text : {std::string_view(key), std::string_view(url), std::string_view(headers),
                                            std::string_view(selecting), bytes})
            digest = digestOf(text, digest);
        return static_cast<std::int64_t>(digest);
    }
};

Result<std::unique_ptr<HttpCacheStore>> HttpCacheStore::open(FileSystem& files, const fs::path& directory,
                                                             const Limits& limits)
{
    auto lock = files.takeDirectory(directory);
    if (!lock) return std::unexpected(std::move(lock.error()));
    std::unique_ptr<HttpCacheStore> store(new HttpCacheStore(files, directory, limits, std::move(*lock)));
    auto opened = store->openIndex();
    if (!opened && Sqlite::isDamage(opened.error())) {
        defaultLog().error("the HTTP cache {} is damaged and starts empty: {}", directory.string(),
                           opened.error().description());
        opened = store->reset();
    }
    if (!opened) return std::unexpected(std::move(opened.error()));
    return store;
}

HttpCacheStore::~HttpCacheStore()
{
    if (_index && !_uses.empty()) (void)_index->transaction([this] { return saveUses(); });
}

bool HttpCacheStore::isInPlace() const
{
    const auto info = _files.info(_directory / kIndex);
    return info && info->number == _indexNumber;
}

Result<void> HttpCacheStore::reset()
{
    _index.reset();
    _uses.clear();
    _mappings.clear();
    for (const std::string& name : _files.list(_directory).value_or(std::vector<std::string>()))
        if (idOf(name) || name.ends_with(kUnfinishedSuffix) || name.starts_with(kIndex))
            (void)_files.remove(_directory / name);
    return openIndex();
}

Result<void> HttpCacheStore::openIndex()
{
    auto index = _files.openDatabase(_directory / kIndex, Sqlite::Access::Exclusive);
    if (!index) return std::unexpected(std::move(index.error()));
    _index.emplace(std::move(*index));
    const auto info = _files.info(_directory / kIndex);
    if (!info) return std::unexpected(info.error());
    _indexNumber = info->number;
    (void)_index->execute("PRAGMA synchronous = NORMAL"); // consistent after a power cut, without the latest changes

    auto adopted = _index->adopt(kSchema);
    return adopted ? sweep() : std::move(adopted);
}

Result<void> HttpCacheStore::sweep()
{
    _size = 0;
    _lastUse = 0;
    bool sound = true;
    std::vector<std::int64_t> ids;
    // A damaged index of "entry" would hide responses, and those that are stored in their place.
    auto read = _index->run("PRAGMA integrity_check(entry)", {},
                            [&](const Sqlite::Row& row) { sound = sound && row.text(0) == "ok"; });
    if (!read) return read;
    if (!sound) return std::unexpected(damaged("a row and its index differ"));
    read = _index->run("SELECT id, size, used FROM entry ORDER BY id", {}, [&](const Sqlite::Row& row) {
        const std::int64_t size = row.integer(1);
        sound = sound && size >= 0 && size <= static_cast<std::int64_t>(_limits.capacity) && row.integer(2) >= 0 &&
                row.integer(2) < INT64_MAX / 2;
        _size += static_cast<std::uint64_t>(std::max<std::int64_t>(size, 0));
        _lastUse = std::max(_lastUse, row.integer(2));
        ids.push_back(row.integer(0));
    });
    if (!read) return read;
    if (!sound) return std::unexpected(damaged("sizes or uses out of range"));
    for (const std::string& name : _files.list(_directory).value_or(std::vector<std::string>())) {
        const auto id = idOf(name);
        if ((id && !std::ranges::binary_search(ids, *id)) || name.ends_with(kUnfinishedSuffix))
            (void)_files.remove(_directory / name);
    }
    return {};
}

Result<std::vector<std::string>> HttpCacheStore::keys()
{
    std::vector<std::string> keys;
    auto read =
        _index->run("SELECT key FROM entry", {}, [&](const Sqlite::Row& row) { keys.emplace_back(row.text(0)); });
    if (!read) return std::unexpected(std::move(read.error()));
    return keys;
}

Result<std::shared_ptr<const StoredResponse>> HttpCacheStore::find(const std::string& key, const Url& likely)
{
    std::optional<Row> row;
    bool incomplete = false;
    auto read =
        _index->run("SELECT answer.id, status, url, headers, selecting, requested, received, public, bodySize, xxh3,"
                    " body FROM entry LEFT JOIN answer ON answer.id = entry.id WHERE key = ?",
                    {std::string_view(key)}, [&](const Sqlite::Row& found) {
                        // Both are in one transaction.
                        if ((incomplete = found.isNull(0))) return;
                        const auto text = [&](int column) { return std::string(found.text(column)); };
                        row = Row{.id = found.integer(0),
                                  .status = found.integer(1),
                                  .url = text(2),
                                  .headers = text(3),
                                  .selecting = text(4),
                                  .requested = found.integer(5),
                                  .received = found.integer(6),
                                  .publicPeer = found.integer(7),
                                  .bodySize = found.integer(8),
                                  .digest = found.integer(9)};
                        if (!found.isNull(10)) row->body = text(10);
                    });
    if (!read) {
        // SQLite reports this for a truncated file.
        if (read.error().code == SQLITE_IOERR) return std::unexpected(damaged("the index can't be read"));
        return std::unexpected(std::move(read.error()));
    }
    if (incomplete) return std::unexpected(damaged("an entry has no response"));
    if (!row) return nullptr;

    const bool mapped = !row->body;
    std::optional<Bytes> body =
        mapped ? mapBody(row->id, static_cast<std::uint64_t>(row->bodySize)) : Bytes(std::move(*row->body));
    auto url = row->url == likely.string() ? std::optional(likely) : Url::parse(row->url);
    if (!body || !url || row->digestWith(key, body->view()) != row->digest) {
        defaultLog().error("response {} in the HTTP cache is damaged and dropped", row->id);
        if (auto removed = remove(key); !removed) return std::unexpected(std::move(removed.error()));
        return nullptr;
    }
    noteUse(key);
    auto stored = std::make_shared<StoredResponse>();
    stored->response = {
        .url = std::move(*url), .statusCode = static_cast<int>(row->status), .headers = headersOf(row->headers)};
    if (row->publicPeer != Row::kUnknown) stored->response.publicPeer = row->publicPeer != 0;
    stored->body = std::move(*body);
    stored->selecting = std::move(row->selecting);
    stored->requested = Date(Duration(row->requested));
    stored->received = Date(Duration(row->received));
    stored->mapped = mapped;
    return stored;
}

Result<std::vector<std::string>> HttpCacheStore::put(const std::string& key, const StoredResponse& stored)
{
    const std::string_view body = stored.body.view();
    Row row{.status = stored.response.statusCode,
            .url = stored.response.url.string(),
            .headers = linesOf(stored.response.headers),
            .selecting = stored.selecting,
            .requested = countOf(stored.requested),
            .received = countOf(stored.received),
            .publicPeer = stored.response.publicPeer ? std::int64_t{*stored.response.publicPeer} : Row::kUnknown,
            .bodySize = static_cast<std::int64_t>(body.size())};
    row.digest = row.digestWith(key, body);
    const std::uint64_t size =
        kEntrySize + key.size() + row.url.size() + row.headers.size() + row.selecting.size() + body.size();
    const bool asFile = body.size() >= _limits.minimumMappedSize;

    std::vector<std::int64_t> old;
    std::vector<std::string> evicted;
    std::uint64_t total = _size;
    const auto drop = [&](const Sqlite::Row& entry) {
        old.push_back(entry.integer(0));
        total -= std::min(total, static_cast<std::uint64_t>(std::max<std::int64_t>(entry.integer(1), 0)));
    };
    auto done = _index->transaction([&]() -> Result<void> {
        auto step = saveUses();
        if (step) step = _index->run("SELECT id, size FROM entry WHERE key = ?", {std::string_view(key)}, drop);
        for (std::int64_t last = -1, begin = -2; step && total + size > _limits.capacity && last != begin;) {
            begin = last;
            step = _index->run("SELECT id, size, key, used FROM entry WHERE used > ? ORDER BY used LIMIT 16", {last},
                               [&](const Sqlite::Row& entry) {
                                   last = entry.integer(3);
                                   if (total + size <= _limits.capacity || entry.text(2) == key) return;
                                   drop(entry);
                                   evicted.emplace_back(entry.text(2));
                               });
        }
        if (step) step = forget(old);
        if (step)
            step = _index->run("INSERT INTO entry (key, size, used) VALUES (?, ?, ?)",
                               {std::string_view(key), static_cast<std::int64_t>(size), ++_lastUse});
        if (!step) return step;
        row.id = _index->lastInsertedRow();
        if (asFile)
            if (auto written = _files.writeUnsynced(bodyPath(row.id), body); !written) return written;
        return _index->run("INSERT INTO answer VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?, ?)",
                           {row.id, row.status, std::string_view(row.url), std::string_view(row.headers),
                            std::string_view(row.selecting), row.requested, row.received, row.publicPeer, row.bodySize,
                            row.digest, asFile ? Sqlite::Parameter() : Sqlite::Parameter(body)});
    });
    if (!done) {
        if (row.id != 0) removeBody(row.id);
        return std::unexpected(std::move(done.error()));
    }
    for (const std::int64_t id : old) removeBody(id);
    _size = total + size;
    return evicted;
}

Result<void> HttpCacheStore::remove(const std::string& key)
{
    std::vector<std::int64_t> old;
    std::uint64_t size = 0;
    auto done = _index->transaction([&] {
        auto step = _index->run("SELECT id, size FROM entry WHERE key = ?", {std::string_view(key)},
                                [&](const Sqlite::Row& entry) {
                                    old.push_back(entry.integer(0));
                                    size += static_cast<std::uint64_t>(std::max<std::int64_t>(entry.integer(1), 0));
                                });
        return step ? forget(old) : std::move(step);
    });
    if (!done) return done;
    for (const std::int64_t id : old) removeBody(id);
    _size -= std::min(_size, size);
    _uses.erase(key);
    return {};
}

void HttpCacheStore::noteUse(const std::string& key)
{
    _uses[key] = ++_lastUse;
    if (_uses.size() >= kMaximumUnsavedUses) (void)_index->transaction([this] { return saveUses(); });
}

Result<void> HttpCacheStore::saveUses()
{
    for (const auto& [key, use] : std::exchange(_uses, {}))
        if (auto saved = _index->run("UPDATE entry SET used = ? WHERE key = ?", {use, std::string_view(key)}); !saved)
            return saved;
    return {};
}

Result<void> HttpCacheStore::forget(const std::vector<std::int64_t>& ids)
{
    for (const std::int64_t id : ids) {
        auto gone = _index->run("DELETE FROM entry WHERE id = ?", {id});
        if (gone) gone = _index->run("DELETE FROM answer WHERE id = ?", {id});
        if (!gone) return gone;
    }
    return {};
}

fs::path HttpCacheStore::bodyPath(std::int64_t id) const
{
    return _directory / fmt::format("{}{}", id, kBodySuffix);
}

/// Returns nothing if the file is missing or has another size. Uses a cached mapping only if its file was not replaced.
std::optional<Bytes> HttpCacheStore::mapBody(std::int64_t id, std::uint64_t size)
{
    if (const auto kept = std::ranges::find(_mappings, id, &Mapping::id); kept != _mappings.end()) {
        const auto info = _files.info(bodyPath(id));
        if (info && info->number == kept->number && info->size == size && kept->body.size() == size) {
            _mappings.splice(_mappings.begin(), _mappings, kept);
            return kept->body;
        }
        _mappings.erase(kept);
    }
    const auto file = _files.openForReading(bodyPath(id));
    const auto info = file ? fileInfo(*file) : std::unexpected(file.error());
    if (!info || info->size != size) return std::nullopt;
    if (size == 0) return Bytes();
    auto body = mapFile(*file, size);
    if (!body) return std::nullopt;
    _mappings.push_front({id, info->number, *body});
    std::size_t all = 0;
    for (const Mapping& mapping : _mappings) all += mapping.body.size();
    for (; _mappings.size() > kMaximumMappings || all > kMostMapped; _mappings.pop_back())
        all -= _mappings.back().body.size();
    return std::move(*body);
}

void HttpCacheStore::removeBody(std::int64_t id)
{
    std::erase_if(_mappings, [id](const Mapping& mapping) { return mapping.id == id; });
    (void)_files.remove(bodyPath(id));
}

} // namespace platform
