#pragma once

#include <expected>
#include <memory>
#include <span>
#include <string>
#include <utility>

#include "tools/collector/Queue.h"

struct pg_conn;

namespace collector {

/// The stored uploads and their events: tables in PostgreSQL. Errors are texts; after one, make another
/// `Store`. Use it on one thread.
class Store {
public:
    /// Connects, and makes the tables if they are missing.
    [[nodiscard]] static std::expected<Store, std::string> connect(const std::string& database);

    /// Checks uploads as the development service does, and stores each under its digest, with its events; or as
    /// refused, with the reason. An upload that is stored already changes nothing. All are on disk when this returns.
    std::expected<void, std::string> add(std::span<const Queued> uploads);

private:
    using Connection = std::unique_ptr<pg_conn, void (*)(pg_conn*)>;
    explicit Store(Connection connection) : _connection(std::move(connection)) {}
    Connection _connection;
};

} // namespace collector
