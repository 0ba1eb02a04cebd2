#pragma once

#include <expected>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "tools/devserver/Http.h"

struct redisContext;

namespace collector {

/// An upload in the queue.
struct Queued {
    std::string id; ///< of the queue
    devserver::Request request;
};

/// The uploads that wait to be stored: a Redis stream with one group of consumers. The queue's server must write each
/// change to disk before it answers ("appendfsync always"). Errors are texts; after one, make another `Queue`. Use it
/// on one thread.
class Queue {
public:
    /// Connects to the server's Unix socket.
    [[nodiscard]] static std::expected<Queue, std::string> connect(const std::string& socket);

    /// Adds an upload: its path, body, and the header fields that its check needs. It is on disk when this returns.
    std::expected<void, std::string> add(const devserver::Request& upload);

    /// Makes the group if there is none yet.
    std::expected<void, std::string> makeGroup();
    /// Returns uploads for this consumer: those that another consumer took long ago and didn't remove, else new ones.
    /// Waits for a second if there are none.
    std::expected<std::vector<Queued>, std::string> next(const std::string& consumer);
    /// Removes an upload that is stored.
    std::expected<void, std::string> remove(const std::string& id);

private:
    using Context = std::unique_ptr<redisContext, void (*)(redisContext*)>;
    explicit Queue(Context context) : _context(std::move(context)) {}
    Context _context;
};

} // namespace collector
