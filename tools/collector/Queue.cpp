#include "tools/collector/Queue.h"

#include <array>
#include <hiredis/hiredis.h>
#include <string_view>

namespace collector {

namespace {

constexpr const char* kStream = "uploads";
constexpr const char* kGroup = "consumers";
constexpr const char* kTaken = "2000"; // milliseconds after which another consumer may take an upload over
constexpr const char* kBatch = "16";
constexpr timeval kTimeout{.tv_sec = 10, .tv_usec = 0};
constexpr std::array kHeaders{"Content-Encoding", "X-Quorvane-Digest"};

using Reply = std::unique_ptr<redisReply, decltype(&freeReplyObject)>;
using Words = std::vector<std::string_view>;

std::string_view textOf(const redisReply& reply)
{
    return reply.type == REDIS_REPLY_STRING ? std::string_view(reply.str, reply.len) : std::string_view();
}

std::expected<Reply, std::string> call(redisContext& context, const Words& words)
{
    std::vector<const char*> texts;
    std::vector<std::size_t> lengths;
    for (const std::string_view word : words) {
        texts.push_back(word.data());
        lengths.push_back(word.size());
    }
    Reply reply(static_cast<redisReply*>(
                    redisCommandArgv(&context, static_cast<int>(words.size()), texts.data(), lengths.data())),
                &freeReplyObject);
    if (!reply) return std::unexpected(std::string(context.errstr));
    if (reply->type == REDIS_REPLY_ERROR) return std::unexpected(std::string(reply->str, reply->len));
    return reply;
}

std::expected<void, std::string> run(redisContext& context, const Words& words)
{
    const auto done = call(context, words);
    return done ? std::expected<void, std::string>() : std::unexpected(done.error());
}

/// Reads [[id, [name, value, …]], …]. A removed upload has no fields.
std::vector<Queued> uploadsIn(const redisReply& entries)
{
    std::vector<Queued> uploads;
    for (std::size_t i = 0; i < entries.elements; ++i) {
        const redisReply& entry = *entries.element[i];
        if (entry.elements != 2) continue;
        Queued& upload = uploads.emplace_back();
        upload.id = textOf(*entry.element[0]);
        upload.request.method = "POST";
        const redisReply& fields = *entry.element[1];
        for (std::size_t j = 0; j + 1 < fields.elements; j += 2) {
            const std::string_view name = textOf(*fields.element[j]);
            std::string value(textOf(*fields.element[j + 1]));
            if (name == "path")
                upload.request.path = std::move(value);
            else if (name == "body")
                upload.request.body = std::move(value);
            else
                upload.request.headers.emplace_back(name, std::move(value));
        }
    }
    return uploads;
}

} // namespace

std::expected<Queue, std::string> Queue::connect(const std::string& socket)
{
    Queue queue(Context(redisConnectUnixWithTimeout(socket.c_str(), kTimeout), &redisFree));
    if (!queue._context) return std::unexpected("out of memory");
    if (queue._context->err != 0) return std::unexpected(std::string(queue._context->errstr));
    redisSetTimeout(queue._context.get(), kTimeout);
    return queue;
}

std::expected<void, std::string> Queue::add(const devserver::Request& upload)
{
    Words words{"XADD", kStream, "*", "path", upload.path, "body", upload.body};
    for (const char* name : kHeaders)
        if (const std::string* value = devserver::findHeader(upload.headers, name))
            words.insert(words.end(), {name, *value});
    return run(*_context, words);
}

std::expected<void, std::string> Queue::makeGroup()
{
    const auto made = run(*_context, {"XGROUP", "CREATE", kStream, kGroup, "0", "MKSTREAM"});
    return !made && made.error().starts_with("BUSYGROUP") ? std::expected<void, std::string>() : made;
}

std::expected<std::vector<Queued>, std::string> Queue::next(const std::string& consumer)
{
    const auto claimed = call(*_context, {"XAUTOCLAIM", kStream, kGroup, consumer, kTaken, "0", "COUNT", kBatch});
    if (!claimed) return std::unexpected(claimed.error());
    if ((*claimed)->elements > 1 && (*claimed)->element[1]->elements > 0) return uploadsIn(*(*claimed)->element[1]);

    const auto read = call(*_context, {"XREADGROUP", "GROUP", kGroup, consumer, "COUNT", kBatch, "BLOCK", "1000",
                                       "STREAMS", kStream, ">"});
    if (!read) return std::unexpected(read.error());
    if ((*read)->elements == 0) return std::vector<Queued>();
    return uploadsIn(*(*read)->element[0]->element[1]); // [[stream, entries]]
}

std::expected<void, std::string> Queue::remove(const std::string& id)
{
    // In this order: between the two, a kill leaves a taken upload that is gone, which XAUTOCLAIM forgets.
    if (const auto done = run(*_context, {"XDEL", kStream, id}); !done) return done;
    return run(*_context, {"XACK", kStream, kGroup, id});
}

} // namespace collector
