#include "platform/net/BackgroundStore.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>

#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/base/Uuid.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr const char* kDatabase = "transfers.db";
constexpr std::string_view kUploadSuffix = ".body";
constexpr std::string_view kDownloadSuffix = ".download";
/// Suffix of a copy that a kill interrupted.
constexpr std::string_view kPartialSuffix = ".tmp";
constexpr std::string_view kTemporaryPrefix = "background-transfers-";
/// A store with other tables is replaced by an empty one. Times are nanoseconds of lived time.
constexpr std::array kTables{
    "CREATE TABLE task (identifier INTEGER PRIMARY KEY AUTOINCREMENT, upload INTEGER NOT NULL, request TEXT NOT NULL,"
    " requestBody TEXT NOT NULL, bodySize INTEGER NOT NULL, note TEXT, resumed INTEGER NOT NULL,"
    " deadline INTEGER NOT NULL, failures INTEGER NOT NULL, notBefore INTEGER NOT NULL, outcome TEXT)",
    "CREATE TABLE hold (host TEXT PRIMARY KEY, until INTEGER NOT NULL)",
    "CREATE TABLE time (one INTEGER PRIMARY KEY CHECK (one = 1), mark TEXT NOT NULL)"};

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

/// Returns nothing for a row that isn't a valid task, for example because it was edited.
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

/// Returns the identifier in the name of a task's file, or nothing for other files.
std::optional<std::uint64_t> identifierOf(std::string_view name)
{
    const bool ours = name.ends_with(kUploadSuffix) || name.ends_with(kDownloadSuffix);
    std::uint64_t identifier = 0;
    const auto read = std::from_chars(name.data(), name.data() + name.size(), identifier);
    const bool whole = read.ec == std::errc() && *read.ptr == '.';
    return ours && whole ? std::optional(identifier) : std::nullopt;
}

} // namespace

bool BackgroundStore::exists(FileSystem& files, const fs::path& directory)
{
    return files.info(directory / kDatabase).has_value();
}

Result<std::unique_ptr<BackgroundStore>> BackgroundStore::open(FileSystem& files, const fs::path& directory)
{
    auto lock = files.takeDirectory(directory);
    if (!lock) return std::unexpected(std::move(lock.error()));
    std::unique_ptr<BackgroundStore> store(new BackgroundStore(files, directory, std::move(*lock)));
    auto database = store->openDatabase();
    if (!database && Sqlite::isDamage(database.error())) {
        defaultLog().error("background transfers {} are damaged, starting with an empty list: {}", directory.string(),
                           database.error().description());
        store->_database.reset();
        store->_contents = {};
        for (const char* suffix : {"", "-wal", "-journal", "-shm"})
            (void)files.remove(directory / (kDatabase + std::string(suffix)));
        database = store->openDatabase();
    }
    if (!database) return std::unexpected(std::move(database.error()));
    return store;
}

Result<std::unique_ptr<BackgroundStore>> BackgroundStore::openTemporary(FileSystem& files, const fs::path& parent)
{
    for (const std::string& name : files.list(parent).value_or(std::vector<std::string>())) {
        if (!name.starts_with(kTemporaryPrefix)) continue;
        if (const auto unused = files.takeDirectory(parent / name)) (void)files.removeDirectory(parent / name);
    }
    const fs::path directory = parent / (std::string(kTemporaryPrefix) + Uuid::random().string());
    auto store = open(files, directory);
    if (!store) {
        (void)files.removeDirectory(directory);
        return store;
    }
    (*store)->_temporary = true;
    (void)(*store)->_database->execute("PRAGMA synchronous = OFF");
    return store;
}

BackgroundStore::~BackgroundStore()
{
    _database.reset();
    if (_temporary) (void)_files.removeDirectory(_directory);
}

Result<void> BackgroundStore::openDatabase()
{
    auto database = _files.openDatabase(_directory / kDatabase, Sqlite::Access::Exclusive);
    if (!database) return std::unexpected(std::move(database.error()));
    _database = std::move(*database);
    auto checked = checkDatabase();
    return checked ? load() : std::move(checked);
}

Result<void> BackgroundStore::checkDatabase()
{
    std::string verdict;
    auto done = _database->run("PRAGMA quick_check(1)", {}, [&](const Sqlite::Row& row) { verdict = row.text(0); });
    if (done && verdict != "ok")
        done = std::unexpected(Error::withReason(kSqliteErrorDomain, Sqlite::kCorrupt, std::move(verdict)));
    return done ? _database->adopt(kTables) : std::move(done);
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
        read = _database->run("SELECT mark FROM time", {},
                              [&](const Sqlite::Row& row) { _contents.time = LivedTime::Mark::parse(row.text(0)); });
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
    for (const std::string& name : _files.list(_directory).value_or(std::vector<std::string>())) {
        const auto identifier = identifierOf(name);
        const bool isOwned = identifier && std::ranges::binary_search(tasks, *identifier, {}, &StoredTask::identifier);
        if (name.ends_with(kPartialSuffix) || (identifier && !isOwned)) (void)_files.remove(_directory / name);
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

        // The body is complete on disk before the task refers to it.
        const fs::path path = bodyPath(added.identifier);
        if (auto copied = _files.copy(path, *body, maximumBody); !copied) {
            if (copied.error().code != EFBIG) return copied;
            return std::unexpected(urlError(kUrlTooLarge, "the bodies of all pending uploads are too large"));
        }
        const auto info = _files.info(path);
        if (!info) return std::unexpected(info.error());
        added.bodySize = info->size;
        return _database->run("UPDATE task SET bodySize = ? WHERE identifier = ?",
                              {static_cast<std::int64_t>(added.bodySize), static_cast<std::int64_t>(added.identifier)});
    });
    if (done)
        task = std::move(added);
    else if (added.identifier != 0)
        (void)_files.remove(bodyPath(added.identifier));
    return done;
}

Result<void> BackgroundStore::saveTime(const LivedTime::Mark& time)
{
    const std::string mark = time.text();
    return _database->run("INSERT OR REPLACE INTO time VALUES (1, ?)", {std::string_view(mark)});
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
    (void)_files.remove(bodyPath(identifier));
    (void)_files.remove(downloadPath(identifier));
    return {};
}

Result<FileHandle> BackgroundStore::openBody(const StoredTask& task) const
{
    auto file = _files.openForReading(bodyPath(task.identifier));
    if (!file) return file;
    const auto info = fileInfo(*file);
    if (!info) return std::unexpected(info.error());
    if (info->size != task.bodySize)
        return std::unexpected(Error::withReason(kPosixErrorDomain, EBADMSG, "the body was changed on disk"));
    return file;
}

fs::path BackgroundStore::bodyPath(std::uint64_t identifier) const
{
    return _directory / fmt::format("{}{}", identifier, kUploadSuffix);
}

fs::path BackgroundStore::downloadPath(std::uint64_t identifier) const
{
    return _directory / fmt::format("{}{}", identifier, kDownloadSuffix);
}

bool BackgroundStore::hasDownload(std::uint64_t identifier) const
{
    return _files.info(downloadPath(identifier)).has_value();
}

Result<FileHandle> BackgroundStore::createDownload(std::uint64_t identifier) const
{
    return _files.create(downloadPath(identifier));
}

Result<void> BackgroundStore::syncDownload(std::uint64_t identifier) const
{
    return _temporary ? Result<void>() : _files.sync(downloadPath(identifier));
}

} // namespace platform
