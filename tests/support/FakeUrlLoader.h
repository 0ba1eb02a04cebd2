#pragma once

#include <cstdlib>
#include <memory>
#include <string>
#include <unistd.h>
#include <vector>

#include "platform/net/HttpCache.h"
#include "platform/net/UrlSession.h"
#include "platform/run/Queue.h"

namespace platform::test {

/// A loader that a test answers by hand.
class FakeUrlLoader final : public UrlLoader {
public:
    class Task final : public UrlTask, public std::enable_shared_from_this<Task> {
    public:
        Task(std::uint64_t identifier, UrlRequest request, UrlSession::DataCompletion completion,
             std::shared_ptr<Queue> queue)
            : _identifier(identifier), _request(std::move(request)), _completion(std::move(completion)),
              _queue(std::move(queue))
        {}
        void resume() override { resumed = true; }
        void cancel() override { fail(Error::withReason(std::string(kUrlErrorDomain), kUrlCancelled, "cancelled")); }
        [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
        [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
        [[nodiscard]] Value timingData() const override { return timing; }

        /// The body of a transfer goes into its file. The answer comes from where redirects led.
        void respond(int status, std::string body = "", HttpHeaders headers = {}, std::optional<Url> from = {})
        {
            if (files.download) {
                if (pwrite(files.download.fd(), body.data(), body.size(), 0) < 0) std::abort();
                body.clear();
            }
            finish(Bytes(std::move(body)), UrlResponse{from.value_or(_request.url), true, status, std::move(headers)},
                   std::nullopt);
        }
        void fail(Error error) { finish(std::nullopt, std::nullopt, std::move(error)); }
        void finish(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error)
        {
            if (finished) return;
            finished = true;
            _queue->async([self = shared_from_this(), data = std::move(data), response = std::move(response),
                           error = std::move(error)]() mutable {
                std::exchange(self->_completion, {})(std::move(data), std::move(response), std::move(error));
            });
        }

        /// Ends it without a word to anyone.
        void drop()
        {
            finished = true;
            _completion = {};
            _queue.reset(); // which may hold the end of this task, if nobody ran it
        }

        bool resumed = false;
        bool finished = false;
        Value timing;
        TransferFiles files; ///< of a transfer

    private:
        std::uint64_t _identifier;
        UrlRequest _request;
        UrlSession::DataCompletion _completion;
        std::shared_ptr<Queue> _queue;
    };

    class Session final : public UrlSession {
    public:
        Session(UrlSessionConfiguration configuration_, std::shared_ptr<Queue> queue)
            : configuration(std::move(configuration_)), _queue(std::move(queue))
        {
            if (!configuration.cache) return;
            HttpCacheConfiguration inMemory = *configuration.cache;
            inMemory.directory.clear();
            _cache = HttpCache::make(std::move(inMemory));
        }
        std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override
        {
            tasks.push_back(
                std::make_shared<Task>(tasks.size() + 1, std::move(request), std::move(completion), _queue));
            return tasks.back();
        }
        std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files,
                                              DataCompletion completion) override
        {
            auto task = dataTask(std::move(request), std::move(completion));
            tasks.back()->files = std::move(files);
            return task;
        }
        /// In memory only. Its tasks neither ask nor fill it.
        [[nodiscard]] std::shared_ptr<HttpCache> cache() const override { return _cache; }
        UrlSessionConfiguration configuration;
        std::vector<std::shared_ptr<Task>> tasks;

    private:
        std::shared_ptr<Queue> _queue;
        std::shared_ptr<HttpCache> _cache;
    };

    FakeUrlLoader() = default;
    /// Breaks the rings of tasks that nobody answered, or whose end nobody ran.
    ~FakeUrlLoader() override
    {
        for (const auto& session : sessions)
            for (const auto& task : std::vector(session->tasks)) task->drop();
    }

    std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                            std::shared_ptr<Queue> queue) override
    {
        sessions.push_back(std::make_shared<Session>(std::move(configuration), std::move(queue)));
        return sessions.back();
    }

    /// Cancels what is unanswered, and says whether there was any: an unanswered task keeps its session.
    bool cancelAll()
    {
        bool any = false;
        for (const auto& session : sessions) {
            for (const auto& task : std::vector(session->tasks)) {
                any = any || !task->finished;
                task->cancel();
            }
        }
        return any;
    }

    /// In the order in which they were made.
    std::vector<std::shared_ptr<Session>> sessions;
};

} // namespace platform::test
