// tavrin-collector: the two programs of a small collector of uploads. One takes them into a queue, the other stores
// them.

#include <csignal>
#include <cstdio>
#include <string>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "tools/collector/Queue.h"
#include "tools/collector/Store.h"
#include "tools/devserver/HttpServer.h"
#include "tools/shared/CommandLine.h"

namespace collector {
namespace {

struct Options {
    std::string queue;
    int port = 0;
    std::string store;
    std::string name = "1";
};

/// Answers 200 once the upload is in the queue, else 503. The front end must turn the latter into a closed connection:
/// devices drop an upload that has any other answer than 200, and repeat one that has none.
devserver::Answer take(const Options& options, const devserver::Request& request)
{
    if (request.method != "POST") return devserver::errorAnswer(405, "uploads are sent with POST");
    thread_local std::expected<Queue, std::string> queue = std::unexpected("not connected");
    if (!queue) queue = Queue::connect(options.queue);
    const auto added = queue ? queue->add(request) : std::unexpected(queue.error());
    if (added) return devserver::jsonAnswer(platform::Value::dictionaryOf({{"received", request.body.size()}}));
    fmt::print(stderr, "tavrin-collector: not queued: {}\n", added.error());
    queue = std::unexpected(added.error());
    return devserver::errorAnswer(503, "the queue is away");
}

std::expected<void, std::string> accept(const Options& options)
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr); // before the first thread starts
    devserver::HttpServer server;
    if (auto bound = server.bind("127.0.0.1", options.port); !bound)
        return std::unexpected(fmt::format("can't listen on port {}: {}", options.port, bound.error()));
    server.start([&](const devserver::Request& request) { return take(options, request); });
    int signal = 0;
    sigwait(&signals, &signal);
    server.stop();
    return {};
}

/// Stores uploads until something fails. What was not removed from the queue is stored again by the next consumer.
std::expected<void, std::string> consume(const Options& options)
{
    auto queue = Queue::connect(options.queue);
    if (!queue) return std::unexpected(options.queue + ": " + queue.error());
    if (auto made = queue->makeGroup(); !made) return made;
    auto store = Store::connect(options.store);
    if (!store) return std::unexpected(store.error());
    for (;;) {
        const auto uploads = queue->next(options.name);
        if (!uploads) return std::unexpected(uploads.error());
        if (auto added = store->add(*uploads); !added) return added;
        for (const Queued& upload : *uploads)
            if (auto removed = queue->remove(upload.id); !removed) return removed;
    }
}

} // namespace
} // namespace collector

int main(int argc, char** argv)
{
    namespace tools = tavrin::tools;
    collector::Options options;
    CLI::App app("Collects uploads: see docs/fleet.md.");
    tools::useReadableHelp(app);
    app.require_subcommand(1);
    CLI::App* const accept = app.add_subcommand("accept", "Take uploads over HTTP into the queue");
    CLI::App* const consume = app.add_subcommand("consume", "Check uploads of the queue, and store their events");
    for (CLI::App* command : {accept, consume})
        command->add_option("--queue", options.queue, "Unix socket of the Redis server")
            ->required()
            ->type_name("SOCKET");
    tools::takesWholeNumber(accept->add_option("--port", options.port, "Port on 127.0.0.1")->required(), "PORT", 1,
                            65535);
    consume->add_option("--store", options.store, "Connection string of the PostgreSQL database")
        ->required()
        ->type_name("TEXT");
    consume->add_option("--name", options.name, "Name of the consumer, which no other may have")->type_name("NAME");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return tools::endOfParsing(app, error, "tavrin-collector");
    }
    std::signal(SIGPIPE, SIG_IGN);
    const auto done = accept->parsed() ? collector::accept(options) : collector::consume(options);
    if (done) return 0;
    fmt::print(stderr, "tavrin-collector: {}\n", done.error());
    return 1;
}
