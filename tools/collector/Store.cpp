#include "tools/collector/Store.h"

#include <libpq-fe.h>
#include <vector>

#include "tools/devserver/Uploads.h"
#include "tools/shared/Inflate.h"

namespace collector {

namespace {

// The events are of type json, because jsonb can't store a text with "\u0000".
constexpr const char* kTables = R"(
SELECT pg_advisory_xact_lock(1);
CREATE TABLE IF NOT EXISTS uploads (digest text PRIMARY KEY, path text NOT NULL, stored timestamptz NOT NULL DEFAULT now());
CREATE TABLE IF NOT EXISTS events (digest text REFERENCES uploads, number int, type text NOT NULL, timestamp numeric NOT NULL,
                                   event json NOT NULL, PRIMARY KEY (digest, number));
CREATE TABLE IF NOT EXISTS refused (id text PRIMARY KEY, path text NOT NULL, problem text NOT NULL, body bytea NOT NULL);
)";
// A session has many events; what clients send for statistics counts as one.
constexpr const char* kAdd = R"(
WITH added AS (INSERT INTO uploads (digest, path) VALUES ($1, $2) ON CONFLICT DO NOTHING RETURNING digest)
INSERT INTO events SELECT digest, number, event->>'type', (event->>'timestamp')::numeric, event
FROM added, json_array_elements(CASE $2 WHEN '/feedback' THEN $3::json->'fb' ELSE json_build_array(json_build_object(
  'type', 'crowdsourcing', 'timestamp', 0, 'report', $3::json)) END) WITH ORDINALITY AS each (event, number)
)";
constexpr const char* kRefuse = "INSERT INTO refused VALUES ($1, $2, $3, $4) ON CONFLICT DO NOTHING";

using Result = std::unique_ptr<PGresult, decltype(&PQclear)>;

std::expected<void, std::string> outcome(pg_conn* connection, PGresult* result)
{
    const Result owner(result, &PQclear);
    const ExecStatusType status = PQresultStatus(result);
    if (status == PGRES_COMMAND_OK || status == PGRES_TUPLES_OK) return {};
    return std::unexpected(std::string(PQerrorMessage(connection)));
}

/// Runs a statement with parameters, the last one as bytes.
std::expected<void, std::string> run(pg_conn* connection, const char* statement,
                                     const std::vector<std::string>& parameters)
{
    std::vector<const char*> values;
    std::vector<int> lengths;
    for (const std::string& parameter : parameters) {
        values.push_back(parameter.c_str());
        lengths.push_back(static_cast<int>(parameter.size()));
    }
    std::vector<int> formats(parameters.size(), 0);
    formats.back() = 1;
    return outcome(connection, PQexecParams(connection, statement, static_cast<int>(parameters.size()), nullptr,
                                            values.data(), lengths.data(), formats.data(), 0));
}

} // namespace

std::expected<Store, std::string> Store::connect(const std::string& database)
{
    Store store(Connection(PQconnectdb(database.c_str()), &PQfinish));
    pg_conn* const connection = store._connection.get();
    if (PQstatus(connection) != CONNECTION_OK) return std::unexpected(std::string(PQerrorMessage(connection)));
    PQsetNoticeProcessor(connection, [](void*, const char*) {}, nullptr); // "already exists, skipping"
    if (auto made = outcome(connection, PQexec(connection, kTables)); !made) return std::unexpected(made.error());
    return store;
}

std::expected<void, std::string> Store::add(std::span<const Queued> uploads)
{
    pg_conn* const connection = _connection.get();
    auto done = outcome(connection, PQexec(connection, "BEGIN"));
    for (const Queued& queued : uploads) {
        const devserver::Upload upload = devserver::checkUpload(queued.request);
        const auto text = tavrin::tools::inflateRaw(queued.request.body, tavrin::tools::kMaximumUpload);
        if (done && upload.problem)
            done = run(connection, kRefuse, {queued.id, queued.request.path, *upload.problem, queued.request.body});
        else if (done)
            done = run(connection, kAdd, {*upload.digest, queued.request.path, *text});
    }
    if (done) return outcome(connection, PQexec(connection, "COMMIT"));
    if (!outcome(connection, PQexec(connection, "ROLLBACK"))) return done; // the store is away
    if (uploads.size() == 1) // it passed the check, but the store can't hold it
        return run(connection, kRefuse,
                   {uploads[0].id, uploads[0].request.path, done.error(), uploads[0].request.body});
    for (const Queued& queued : uploads)
        if (done = add({&queued, 1}); !done) return done;
    return done;
}

} // namespace collector
