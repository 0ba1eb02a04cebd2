#include "platform/files/Sqlite.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <sqlite3.h>

#include "platform/files/Files.h"
#include "platform/run/WorkerPool.h"

namespace platform {

static_assert(Sqlite::kCorrupt == SQLITE_CORRUPT);

namespace {

/// Limits of a query on a file that others write.
constexpr int kMostSteps = 10'000'000; // of SQLite's virtual machine
constexpr int kLongestRow = 256 << 10; // bytes
/// How long to wait for other users of a shared database.
constexpr int kPatience = 1000; // milliseconds

} // namespace

void Sqlite::Close::operator()(sqlite3* database) const
{
    sqlite3_close_v2(database); // closes after the last statement is finalized
}

void Sqlite::Finalize::operator()(sqlite3_stmt* statement) const
{
    sqlite3_finalize(statement);
}

std::unexpected<Error> Sqlite::failure() const
{
    return std::unexpected(Error::withReason(kSqliteErrorDomain, sqlite3_extended_errcode(_database.get()) & 0xff,
                                             sqlite3_errmsg(_database.get())));
}

Result<Sqlite> Sqlite::open(const std::filesystem::path& path, Access access)
{
    // SQLite copies the database's mode to its other files, and refuses a symbolic link anywhere in the path.
    std::error_code error;
    const auto directory = std::filesystem::canonical(path.parent_path(), error);
    if (error) return std::unexpected(Error::posix(error.value(), path.parent_path().string()));
    const std::filesystem::path real = directory / path.filename();
    const bool readOnly = access == Access::ReadOnly;
    {
        const int mode = readOnly ? O_RDONLY : O_RDWR | O_CREAT;
        const FileHandle file(::open(real.c_str(), mode | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600));
        struct stat status{};
        if (!file || fstat(file.fd(), &status) != 0) return std::unexpected(Error::posix(errno, real.string()));
        if (!S_ISREG(status.st_mode)) return std::unexpected(Error::posix(EINVAL, real.string()));
    }

    sqlite3* database = nullptr;
    const int opened = sqlite3_open_v2(real.c_str(), &database,
                                       (readOnly ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE) | SQLITE_OPEN_NOMUTEX |
                                           SQLITE_OPEN_NOFOLLOW,
                                       nullptr);
    Sqlite result(database);
    if (opened != SQLITE_OK) {
        if (!database) return std::unexpected(Error::posix(ENOMEM, real.string()));
        return result.failure();
    }
    // A manipulated file must not make SQLite call functions through its schema.
    sqlite3_db_config(database, SQLITE_DBCONFIG_DEFENSIVE, 1, nullptr);
    sqlite3_db_config(database, SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0, nullptr);
    if (readOnly) {
        sqlite3_limit(database, SQLITE_LIMIT_LENGTH, kLongestRow);
        sqlite3_progress_handler(database, kMostSteps, [](void*) { return 1; }, nullptr);
    }
    if (access == Access::Shared) sqlite3_busy_timeout(database, kPatience);
    if (access != Access::Exclusive) return result;
    // The write-ahead log of an exclusive database needs no shared memory and costs one sync a transaction. If SQLite
    // can't open it for writing, it opens it for reading, and all later writes fail; the empty transaction notices
    // that.
    if (auto set =
            result.execute("PRAGMA locking_mode = EXCLUSIVE; PRAGMA journal_mode = WAL; PRAGMA synchronous = FULL;"
                           "PRAGMA wal_autocheckpoint = 256; PRAGMA cache_size = -512; BEGIN IMMEDIATE; COMMIT");
        !set)
        return std::unexpected(std::move(set.error()));
    return result;
}

Result<void> Sqlite::adopt(std::span<const char* const> schema)
{
    std::vector<std::string> found;
    auto done = run("SELECT sql FROM sqlite_schema WHERE sql IS NOT NULL AND name NOT LIKE 'sqlite\\_%' ESCAPE '\\'"
                    " ORDER BY rowid",
                    {}, [&](const Row& row) { found.emplace_back(row.text(0)); });
    if (!done || std::ranges::equal(found, schema)) return done;
    if (!found.empty())
        return std::unexpected(Error::withReason(kSqliteErrorDomain, kCorrupt, "the tables are different"));
    return transaction([&] {
        Result<void> made;
        for (const char* statement : schema)
            if (made) made = execute(statement);
        return made;
    });
}

Result<void> Sqlite::execute(const char* statements)
{
    if (sqlite3_exec(_database.get(), statements, nullptr, nullptr, nullptr) != SQLITE_OK) return failure();
    return {};
}

Result<void> Sqlite::run(std::string_view statement, std::initializer_list<Parameter> parameters,
                         const std::function<void(const Row&)>& each)
{
    Statements::node_type taken = takeStatement(statement);
    if (!taken) return failure();
    sqlite3_stmt* const made = taken.mapped().get();
    int position = 0;
    for (const Parameter& parameter : parameters) {
        ++position;
        int bound = SQLITE_OK;
        if (const auto* number = std::get_if<std::int64_t>(&parameter))
            bound = sqlite3_bind_int64(made, position, *number);
        else if (const auto* text = std::get_if<std::string_view>(&parameter))
            // SQLite would bind a null pointer as NULL.
            bound = sqlite3_bind_text64(made, position, text->empty() ? "" : text->data(), text->size(), SQLITE_STATIC,
                                        SQLITE_UTF8);
        if (bound != SQLITE_OK) return failure();
    }
    WorkerPool::shareKeptJobs(); // the statement may wait for the disk, or for other users
    int stepped = SQLITE_ROW;
    while ((stepped = sqlite3_step(made)) == SQLITE_ROW)
        if (each) each(Row(made));
    if (stepped != SQLITE_DONE) return failure();
    sqlite3_reset(made);
    sqlite3_clear_bindings(made);
    _statements.insert(std::move(taken));
    return {};
}

/// Removes the compiled statement from the cache, because a callback may run the same statement. Empty if the text
/// doesn't compile.
Sqlite::Statements::node_type Sqlite::takeStatement(std::string_view text)
{
    auto found = _statements.find(text);
    if (found == _statements.end()) {
        sqlite3_stmt* made = nullptr;
        if (sqlite3_prepare_v3(_database.get(), text.data(), static_cast<int>(text.size()), SQLITE_PREPARE_PERSISTENT,
                               &made, nullptr) != SQLITE_OK)
            return {};
        found = _statements.emplace(text, std::unique_ptr<sqlite3_stmt, Finalize>(made)).first;
    }
    return _statements.extract(found);
}

Result<void> Sqlite::transaction(const std::function<Result<void>()>& work)
{
    if (auto begun = execute("BEGIN IMMEDIATE"); !begun) return begun;
    auto done = work();
    if (done) done = execute("COMMIT");
    if (!done && !sqlite3_get_autocommit(_database.get())) (void)execute("ROLLBACK");
    return done;
}

std::int64_t Sqlite::lastInsertedRow() const
{
    return sqlite3_last_insert_rowid(_database.get());
}

bool Sqlite::isDamage(const Error& error)
{
    constexpr std::array<std::int64_t, 7> kCodes{kCorrupt,          SQLITE_NOTADB,   SQLITE_ERROR, SQLITE_SCHEMA,
                                                 SQLITE_CONSTRAINT, SQLITE_MISMATCH, SQLITE_TOOBIG};
    return error.domain == kSqliteErrorDomain && std::ranges::find(kCodes, error.code) != kCodes.end();
}

bool Sqlite::Row::isNull(int column) const
{
    return sqlite3_column_type(_statement, column) == SQLITE_NULL;
}

std::int64_t Sqlite::Row::integer(int column) const
{
    return sqlite3_column_int64(_statement, column);
}

std::string_view Sqlite::Row::text(int column) const
{
    const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(_statement, column));
    return text ? std::string_view(text, static_cast<std::size_t>(sqlite3_column_bytes(_statement, column))) : "";
}

} // namespace platform
