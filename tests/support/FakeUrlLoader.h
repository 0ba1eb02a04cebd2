#pragma once

#include <memory>
#include <string>
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
        void cancel() override { fail(Error::withReason(kUrlErrorDomain, kUrlCancelled, "cancelled")); }
        [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
        [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
        [[nodiscard]] Value timingData() const override { return timing; }

        /// The body of a transfer goes into its file. The answer comes from where redirects led.
        void respond(int status, std::string body = "", HttpHeaders headers = {}, std::optional<Url> from = {});
        void fail(Error error) { finish(std::nullopt, std::nullopt, std::move(error)); }
        void finish(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error);
        /// Ends it without a word to anyone.
        void drop();

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
        Session(UrlSessionConfiguration configuration_, std::shared_ptr<Queue> queue);
        std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override;
        std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files,
                                              DataCompletion completion) override;
        /// In memory only. Its tasks neither ask nor fill it.
        [[nodiscard]] std::shared_ptr<HttpCache> cache() const override { return _cache; }
        UrlSessionConfiguration configuration;
        std::vector<std::shared_ptr<Task>> tasks;

    private:
        std::shared_ptr<Queue> _queue;
        std::shared_ptr<HttpCache> _cache;
    };

    /// Breaks the rings of tasks that nobody answered, or whose end nobody ran.
    ~FakeUrlLoader() override;

    std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                            std::shared_ptr<Queue> queue) override;
    /// Cancels what is unanswered, and says whether there was any: an unanswered task keeps its session.
    bool cancelAll();

    /// In the order in which they were made.
    std::vector<std::shared_ptr<Session>> sessions;
};

} // namespace platform::test
