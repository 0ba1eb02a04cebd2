#include "platform/net/BackgroundStore.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <fcntl.h>
#include <set>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr const char* kDatabase = "transfers.db";
constexpr std::string_view kBodySuffix = ".body";
constexpr std::string_view kDownloadSuffix = ".download";
constexpr std::string_view kTemporaryPrefix = "background-transfers-";
/// Of the tables below; a store of another version is begun anew.
constexpr std::int64_t kVersion = 1;

constexpr const char* kTables = R"(
CREATE TABLE task (
    identifier INTEGER PRIMARY KEY AUTOINCREMENT,
    upload INTEGER NOT NULL,
    request TEXT NOT NULL,     -- JSON
    requestBody TEXT NOT NULL, -- bytes
    bodySize INTEGER NOT NULL,
    note TEXT,                 -- JSON
    resumed INTEGER NOT NULL,
    deadline INTEGER NOT NULL, -- like notBefore and until: nanoseconds of the lived time
    failures INTEGER NOT NULL,
    notBefore INTEGER NOT NULL,
    outcome TEXT               -- JSON; null until it has ended
);
CREATE TABLE hold (host TEXT PRIMARY KEY, until INTEGER NOT NULL);
CREATE TABLE time (one INTEGER PRIMARY KEY CHECK (one = 1), lived INTEGER NOT NULL, wall INTEGER NOT NULL);
PRAGMA user_version = 1;
)";

std::unexpected<Error> failure(const fs::path& path)
{
    return std::unexpected(Error::posix(errno, path.string()));
}

// ---- values ----

Value toValue(const HttpHeaders& headers)
{
    Value::Array fields;
    for (const auto& [name, value] : headers) fields.push_back(Value::Array{name, value});
    return fields;
}

HttpHeaders headersOf(const Value& value)
{
    HttpHeaders headers;
    for (std::size_t i = 0; i < value.count(); ++i) {
        const std::string* name = value[i][0].asString();
        const std::string* text = value[i][1].asString();
        if (name && text) headers.add(*name, *text);
    }
    return headers;
}

Value toValue(const UrlRequest& request)
{
    Dictionary value{{"url", request.url.string()}, {"method", request.method}, {"headers", toValue(request.headers)}};
    if (request.timeout) value.set("timeout", request.timeout->count());
    if (request.cachePolicy == UrlRequest::CachePolicy::ReloadIgnoringCache) value.set("reload", true);
    return value;
}

std::shared_ptr<const UrlRequest> requestOf(const Value& value, std::string_view body)
{
    const std::string* text = value["url"].asString();
    const std::string* method = value["method"].asString();
    auto url = text ? Url::parse(*text) : std::nullopt;
    if (!url || !method) return nullptr;
    UrlRequest request{.url = std::move(*url), .method = *method, .headers = headersOf(value["headers"])};
    if (!body.empty()) request.body = Bytes(std::string(body));
    if (const auto timeout = value["timeout"].asInt()) request.timeout = Duration(*timeout);
    if (value["reload"].asBool().value_or(false)) request.cachePolicy = UrlRequest::CachePolicy::ReloadIgnoringCache;
    return std::make_shared<const UrlRequest>(std::move(request));
}

Value toValue(const StoredTask::Outcome& outcome)
{
    Dictionary value;
    if (const auto& response = outcome.response) {
        value.set("url", response->url.string());
        value.set("isHttp", response->isHttp);
        value.set("status", response->statusCode);
        value.set("headers", toValue(response->headers));
    }
    if (const auto& error = outcome.error)
        value.set("error", Dictionary{{"domain", error->domain}, {"code", error->code}, {"userInfo", error->userInfo}});
    return value;
}

StoredTask::Outcome outcomeOf(const Value& value)
{
    StoredTask::Outcome outcome;
    if (const auto status = value["status"].asInt()) {
        const std::string* url = value["url"].asString();
        outcome.response = UrlResponse{.url = url ? Url::parse(*url).value_or(Url()) : Url(),
                                       .isHttp = value["isHttp"].asBool().value_or(true),
                                       .statusCode = static_cast<int>(*status),
                                       .headers = headersOf(value["headers"])};
    }
    if (const std::string* domain = value["error"]["domain"].asString())
        outcome.error = Error(*domain, value["error"]["code"].asInt().value_or(0), value["error"]["userInfo"]);
    return outcome;
}

/// A row that can't be read as a task, as after someone edited it, is nothing.
std::optional<StoredTask> taskOf(const Sqlite::Row& row)
{
    StoredTask task{.identifier = static_cast<std::uint64_t>(row.integer(0)),
                    .isUpload = row.integer(1) != 0,
                    .bodySize = static_cast<std::uint64_t>(row.integer(4)),
                    .resumed = row.integer(6) != 0,
                    .deadline = Duration(row.integer(7)),
                    .failures = static_cast<unsigned>(std::clamp<std::int64_t>(row.integer(8), 0, 1'000'000)),
                    .notBefore = Duration(row.integer(9))};
    const auto request = parseJson(row.text(2));
    if (!request) return std::nullopt;
    task.request = requestOf(*request, row.text(3));
    if (!task.request) return std::nullopt;
    if (!row.isNull(5)) task.note = parseJson(row.text(5)).value_or(Value());
    if (!row.isNull(10)) {
        const auto outcome = parseJson(row.text(10));
        if (!outcome) return std::nullopt;
        task.outcome = outcomeOf(*outcome);
    }
    return task;
}

std::optional<std::string> textOf(const Value& value)
{
    return value.isNull() ? std::nullopt : std::optional(toJson(value));
}

Sqlite::Parameter parameter(const std::optional<std::string>& text)
{
    return text ? Sqlite::Parameter(std::string_view(*text)) : Sqlite::Parameter();
}

// ---- files ----

/// Copies all of `from`; a file system that can share the blocks does.
Result<std::uint64_t> copy(const FileHandle& from, const FileHandle& to, std::uint64_t maximum)
{
    struct stat status{};
    if (fstat(from.fd(), &status) != 0) return std::unexpected(Error::posix(errno));
    std::uint64_t copied = 0;
    const auto tooLarge = [&] { return copied > maximum || static_cast<std::uint64_t>(status.st_size) > maximum; };
    bool byKernel = true;
    std::vector<char> chunk;
    while (!tooLarge()) {
        ssize_t count = 0;
        loff_t offset = static_cast<loff_t>(copied);
        if (byKernel) {
            count = copy_file_range(from.fd(), &offset, to.fd(), nullptr, 8u << 20, 0);
            byKernel = count >= 0 || errno == EINTR;
            if (!byKernel && errno == ENOSPC) return std::unexpected(Error::posix(errno));
            if (count < 0) continue;
        } else {
            chunk.resize(64u << 10);
            count = pread(from.fd(), chunk.data(), chunk.size(), offset);
            for (ssize_t written = 0; written < count;) {
                const ssize_t more = write(to.fd(), chunk.data() + written, static_cast<std::size_t>(count - written));
                if (more < 0 && errno != EINTR) return std::unexpected(Error::posix(errno));
                written += std::max<ssize_t>(more, 0);
            }
            if (count < 0 && errno == EINTR) continue;
            if (count < 0) return std::unexpected(Error::posix(errno));
        }
        if (count == 0) return copied;
        copied += static_cast<std::uint64_t>(count);
    }
    return std::unexpected(Error::withReason(std::string(kUrlErrorDomain), kUrlTooLarge,
                                             "the bodies of the waiting uploads are too large together"));
}

/// A new file in place of any that is there.
Result<FileHandle> createAnew(const fs::path& path)
{
    unlink(path.c_str());
    FileHandle file(open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file) return failure(path);
    return file;
}

/// The identifier in the name of a task's file.
std::optional<std::uint64_t> identifierOf(std::string_view name)
{
    const bool ours = name.ends_with(kBodySuffix) || name.ends_with(kDownloadSuffix);
    std::uint64_t identifier = 0;
    const auto read = std::from_chars(name.data(), name.data() + name.size(), identifier);
    const bool whole = read.ec == std::errc() && *read.ptr == '.';
    return ours && whole ? std::optional(identifier) : std::nullopt;
}

std::vector<std::string> namesIn(const fs::path& directory)
{
    return makeSystemFiles()->list(directory).value_or(std::vector<std::string>());
}

void removeDatabase(const fs::path& directory)
{
    for (const char* suffix : {"", "-wal", "-journal", "-shm"})
        unlink((directory / (kDatabase + std::string(suffix))).c_str());
}

} // namespace

bool BackgroundStore::exists(const fs::path& directory)
{
    struct stat status{};
    return lstat((directory / kDatabase).c_str(), &status) == 0;
}

Result<std::unique_ptr<BackgroundStore>> BackgroundStore::open(const fs::path& directory)
{
    if (auto made = makeSystemFiles()->createDirectories(directory); !made)
        return std::unexpected(std::move(made.error()));
    auto opened = LockedDirectory::open(directory);
    if (!opened) return std::unexpected(std::move(opened.error()));
    std::unique_ptr<BackgroundStore> store(new BackgroundStore(directory, std::move(*opened)));
    auto database = store->openDatabase();
    if (!database && Sqlite::isDamage(database.error())) {
        defaultLog().error("background transfers {} are damaged and begun anew: {}", directory.string(),
                           database.error().description());
        store->_database.reset();
        store->_contents = {};
        removeDatabase(directory);
        database = store->openDatabase();
    }
    if (!database) return std::unexpected(std::move(database.error()));
    return store;
}

Result<std::unique_ptr<BackgroundStore>> BackgroundStore::openTemporary(const fs::path& parent)
{
    std::error_code ignored;
    for (const std::string& entry : namesIn(parent)) {
        if (!entry.starts_with(kTemporaryPrefix)) continue;
        if (const auto unused = LockedDirectory::open(parent / entry)) fs::remove_all(parent / entry, ignored);
    }
    std::string name = (parent / (std::string(kTemporaryPrefix) + "XXXXXX")).string();
    if (!mkdtemp(name.data())) return failure(parent);
    auto store = open(name);
    if (!store) {
        fs::remove_all(name, ignored);
        return store;
    }
    (*store)->_temporary = true;
    (void)(*store)->_database->execute("PRAGMA synchronous = OFF");
    return store;
}

BackgroundStore::~BackgroundStore()
{
    _database.reset();
    std::error_code ignored;
    if (_temporary) fs::remove_all(_directory, ignored);
}

Result<void> BackgroundStore::openDatabase()
{
    auto database = Sqlite::open(_directory / kDatabase);
    if (!database) return std::unexpected(std::move(database.error()));
    _database = std::move(*database);
    auto checked = checkDatabase();
    return checked ? load() : std::move(checked);
}

Result<void> BackgroundStore::checkDatabase()
{
    const auto damaged = [](std::string reason) {
        return std::unexpected(Error::withReason(std::string(kSqliteErrorDomain), Sqlite::kCorrupt, std::move(reason)));
    };
    std::int64_t version = 0;
    auto done = _database->run("PRAGMA user_version", {}, [&](const Sqlite::Row& row) { version = row.integer(0); });
    if (done && version == 0) return _database->transaction([&] { return _database->execute(kTables); });
    if (done && version != kVersion) return damaged(fmt::format("version {}", version));
    std::string verdict;
    if (done)
        done = _database->run("PRAGMA quick_check(1)", {}, [&](const Sqlite::Row& row) { verdict = row.text(0); });
    if (done && verdict != "ok") return damaged(verdict);
    return done;
}

Result<void> BackgroundStore::load()
{
    std::vector<std::uint64_t> unreadable;
    auto read = _database->run("SELECT identifier, upload, request, requestBody, bodySize, note, resumed, deadline, "
                               "failures, notBefore, outcome"
                               " FROM task ORDER BY identifier",
                               {}, [&](const Sqlite::Row& row) {
                                   if (auto task = taskOf(row))
                                       _contents.tasks.push_back(std::move(*task));
                                   else
                                       unreadable.push_back(static_cast<std::uint64_t>(row.integer(0)));
                               });
    if (read)
        read = _database->run("SELECT host, until FROM hold", {}, [&](const Sqlite::Row& row) {
            _contents.holds.emplace(row.text(0), Duration(row.integer(1)));
        });
    if (read)
        read = _database->run("SELECT lived, wall FROM time", {}, [&](const Sqlite::Row& row) {
            _contents.time = {Duration(row.integer(0)), Date(Duration(row.integer(1)))};
        });
    if (!read) return read;
    for (const std::uint64_t identifier : unreadable) {
        defaultLog().error("background task {} in {} is damaged and dropped", identifier, _directory.string());
        (void)forget(identifier);
    }
    sweep(_contents.tasks);
    return {};
}

void BackgroundStore::sweep(const std::vector<StoredTask>& tasks) const
{
    for (const std::string& name : namesIn(_directory)) {
        const auto identifier = identifierOf(name);
        if (!identifier) continue;
        const auto owner = std::ranges::lower_bound(tasks, *identifier, {}, &StoredTask::identifier);
        if (owner == tasks.end() || owner->identifier != *identifier) unlink((_directory / name).c_str());
    }
}

Result<void> BackgroundStore::add(StoredTask& task, const FileHandle* body, std::uint64_t maximumBody)
{
    StoredTask added = task;
    auto done = _database->transaction([&]() -> Result<void> {
        const std::string request = toJson(toValue(*task.request));
        if (auto inserted = _database->run(
                "INSERT INTO task (upload, request, requestBody, bodySize, resumed, deadline, failures, notBefore)"
                " VALUES (?, ?, ?, 0, 0, 0, 0, 0)",
                {std::int64_t{task.isUpload}, std::string_view(request), task.request->body.view()});
            !inserted)
            return inserted;
        added.identifier = static_cast<std::uint64_t>(_database->lastInsertedRow());
        if (!body) return {};

        // The body is whole on disk before a task says that it has one.
        auto file = createAnew(bodyPath(added.identifier));
        if (!file) return std::unexpected(std::move(file.error()));
        const auto size = copy(*body, *file, maximumBody);
        if (!size) return std::unexpected(size.error());
        if (!_temporary && (fsync(file->fd()) != 0 || fsync(_lock.directory.fd()) != 0)) return failure(_directory);
        added.bodySize = *size;
        return _database->run("UPDATE task SET bodySize = ? WHERE identifier = ?",
                              {static_cast<std::int64_t>(added.bodySize), static_cast<std::int64_t>(added.identifier)});
    });
    if (done)
        task = std::move(added);
    else if (added.identifier != 0)
        unlink(bodyPath(added.identifier).c_str());
    return done;
}

Result<void> BackgroundStore::saveTime(const LivedTime::Mark& time)
{
    return _database->run("INSERT OR REPLACE INTO time VALUES (1, ?, ?)",
                          {std::int64_t{time.lived.count()}, std::int64_t{time.wall.time_since_epoch().count()}});
}

Result<void> BackgroundStore::save(const StoredTask& task, const LivedTime::Mark& time)
{
    const auto note = textOf(task.note);
    const auto outcome = task.outcome ? std::optional(toJson(toValue(*task.outcome))) : std::nullopt;
    return _database->transaction([&] {
        auto saved = _database->run("UPDATE task SET note = ?, resumed = ?, deadline = ?, failures = ?, notBefore = ?, "
                                    "outcome = ? WHERE identifier = ?",
                                    {parameter(note), std::int64_t{task.resumed}, std::int64_t{task.deadline.count()},
                                     std::int64_t{task.failures}, std::int64_t{task.notBefore.count()},
                                     parameter(outcome), static_cast<std::int64_t>(task.identifier)});
        return saved ? saveTime(time) : std::move(saved);
    });
}

Result<void> BackgroundStore::saveHold(const std::string& host, Duration until, const LivedTime::Mark& time)
{
    return _database->transaction([&] {
        auto saved = _database->run("DELETE FROM hold WHERE until <= ?", {std::int64_t{time.lived.count()}});
        if (saved)
            saved = _database->run("INSERT OR REPLACE INTO hold VALUES (?, ?)",
                                   {std::string_view(host), std::int64_t{until.count()}});
        return saved ? saveTime(time) : std::move(saved);
    });
}

Result<void> BackgroundStore::forget(std::uint64_t identifier)
{
    auto forgotten = _database->run("DELETE FROM task WHERE identifier = ?", {static_cast<std::int64_t>(identifier)});
    if (!forgotten) return forgotten;
    unlink(bodyPath(identifier).c_str());
    unlink(downloadPath(identifier).c_str());
    return {};
}

Result<FileHandle> BackgroundStore::openBody(const StoredTask& task) const
{
    auto file = makeSystemFiles()->openForReading(bodyPath(task.identifier));
    if (!file) return file;
    struct stat status{};
    if (fstat(file->fd(), &status) != 0) return failure(_directory);
    if (static_cast<std::uint64_t>(status.st_size) != task.bodySize)
        return std::unexpected(Error::withReason(std::string(kPosixErrorDomain), EIO, "the body was changed on disk"));
    return file;
}

fs::path BackgroundStore::bodyPath(std::uint64_t identifier) const
{
    return _directory / fmt::format("{}{}", identifier, kBodySuffix);
}

fs::path BackgroundStore::downloadPath(std::uint64_t identifier) const
{
    return _directory / fmt::format("{}{}", identifier, kDownloadSuffix);
}

Result<FileHandle> BackgroundStore::createDownload(std::uint64_t identifier) const
{
    return createAnew(downloadPath(identifier));
}

Result<void> BackgroundStore::syncDownload(std::uint64_t identifier) const
{
    if (_temporary) return {};
    const fs::path path = downloadPath(identifier);
    const FileHandle file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    if (!file || fsync(file.fd()) != 0 || fsync(_lock.directory.fd()) != 0) return failure(path);
    return {};
}

} // namespace platform
