#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <initializer_list>
#include <map>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "platform/values/Error.h"

struct sqlite3;
struct sqlite3_stmt;

namespace platform {

/// Domain of database errors. Codes are SQLite's primary result codes.
inline constexpr std::string_view kSqliteErrorDomain = "SQLite";

/// An open SQLite database; the destructor closes it. One thread at a time.
class Sqlite {
public:
    /// A statement's parameter: null, a number or a text.
    using Parameter = std::variant<std::monostate, std::int64_t, std::string_view>;

    /// A row of a query's result; valid inside the callback.
    class Row {
    public:
        [[nodiscard]] bool isNull(int column) const;
        [[nodiscard]] std::int64_t integer(int column) const; ///< 0 for null and for text that isn't a number
        [[nodiscard]] std::string_view text(int column) const;

    private:
        friend class Sqlite;
        explicit Row(sqlite3_stmt* statement) : _statement(statement) {}
        sqlite3_stmt* _statement;
    };

    enum class Access {
        Exclusive, ///< locks other processes out while it is open; their first access fails with SQLITE_BUSY
        Shared,    ///< other processes may write; waits up to one second for them
        ReadOnly,  ///< other processes may write; never waits. The file is not trusted: a statement ends within about a
                   ///< second (SQLITE_INTERRUPT), and a row has at most 256 KiB (SQLITE_TOOBIG)
    };
    /// Opens the file; fails if it is a symbolic link (its directory may be one). Creates it, mode 0600, unless
    /// `access` is ReadOnly.
    [[nodiscard]] static Result<Sqlite> open(const std::filesystem::path& path, Access access = Access::Exclusive);

    /// Creates the tables and indexes of an empty database with these statements. Fails with kCorrupt if a database has
    /// others than exactly these texts, which another version or program created.
    [[nodiscard]] Result<void> adopt(std::span<const char* const> schema);
    /// Runs statements that have neither parameters nor results.
    [[nodiscard]] Result<void> execute(const char* statements);
    /// Runs one statement and calls `each` with every row. Caches the compiled statement by its text: pass values as
    /// parameters, not in the text.
    [[nodiscard]] Result<void> run(std::string_view statement, std::initializer_list<Parameter> parameters = {},
                                   const std::function<void(const Row&)>& each = {});
    /// Runs `work` in a transaction. Rolls back and returns the error if `work` or the commit fails.
    [[nodiscard]] Result<void> transaction(const std::function<Result<void>()>& work);
    [[nodiscard]] std::int64_t lastInsertedRow() const;

    static constexpr std::int64_t kCorrupt = 11; ///< SQLITE_CORRUPT
    /// Returns true if an error means that the file is damaged: it is not a database, or its tables don't fit the
    /// statements.
    [[nodiscard]] static bool isDamage(const Error& error);

private:
    struct Close {
        void operator()(sqlite3* database) const;
    };
    struct Finalize {
        void operator()(sqlite3_stmt* statement) const;
    };
    using Statements = std::map<std::string, std::unique_ptr<sqlite3_stmt, Finalize>, std::less<>>;
    explicit Sqlite(sqlite3* database) : _database(database) {}
    [[nodiscard]] std::unexpected<Error> failure() const;
    [[nodiscard]] Statements::node_type takeStatement(std::string_view text);

    std::unique_ptr<sqlite3, Close> _database;
    Statements _statements; // compiled ones that are not running
};

} // namespace platform
