#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <initializer_list>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "platform/values/Error.h"

struct sqlite3;
struct sqlite3_stmt;

namespace platform {

/// Domain of the database's errors; the codes are SQLite's primary result codes.
inline constexpr std::string_view kSqliteErrorDomain = "SQLite";

/// An open SQLite database, closed with its last owner. One thread at a time.
class Sqlite {
public:
    /// Null, a number or a text, as a statement's parameter.
    using Parameter = std::variant<std::monostate, std::int64_t, std::string_view>;

    /// A row of a query's result, as long as the callback runs.
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

    /// Who else uses the database.
    enum class Access {
        Exclusive, ///< with nobody: others are locked out while it is open (error SQLITE_BUSY at the first access)
        Shared,    ///< with others that change it; waits for them, a second at most
        ReadOnly,  ///< with others that change it; waits for nobody, and whatever the file holds, a statement ends
                   ///< within about a second (SQLITE_INTERRUPT) and a row has 256 KiB at most (SQLITE_TOOBIG)
    };
    /// Opens the file, which must not be a link; its directory may lie behind one. Makes it, mode 0600, unless it is
    /// only to be read.
    [[nodiscard]] static Result<Sqlite> open(const std::filesystem::path& path, Access access = Access::Exclusive);

    /// Makes the tables and indexes of an empty database by these statements, or checks that it has exactly them, made
    /// by the same texts. Fails with kCorrupt if it has others: what another version, or another program, made.
    [[nodiscard]] Result<void> adopt(std::span<const char* const> schema);
    /// Runs statements without parameters and results.
    [[nodiscard]] Result<void> execute(const char* statements);
    /// Runs one statement; `each` is called with every row. It is kept, compiled, for the next time: let it be one of a
    /// few texts, and its values parameters.
    [[nodiscard]] Result<void> run(std::string_view statement, std::initializer_list<Parameter> parameters = {},
                                   const std::function<void(const Row&)>& each = {});
    /// Runs `work` in a transaction, which a failure of either undoes.
    [[nodiscard]] Result<void> transaction(const std::function<Result<void>()>& work);
    [[nodiscard]] std::int64_t lastInsertedRow() const;

    static constexpr std::int64_t kCorrupt = 11; ///< SQLITE_CORRUPT
    /// Whether an error says that the file's contents aren't, or are no longer, what was written: not a database, or
    /// one whose tables don't fit the statements.
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
    Statements _statements; // without those that run
};

} // namespace platform
