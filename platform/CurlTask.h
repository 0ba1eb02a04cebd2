#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include <curl/curl.h>

#include "platform/CurlSupport.h"
#include "platform/Queue.h"
#include "platform/UrlSession.h"

namespace platform {

class CurlTask;

/// Who does the loads. Any thread.
class CurlTaskRunner {
public:
    virtual ~CurlTaskRunner() = default;
    virtual void start(std::shared_ptr<CurlTask> task) = 0;
    virtual void cancel(std::shared_ptr<CurlTask> task) = 0;
};

/// One load. Whoever holds the multi handle fills it in; the completion hands the results on.
class CurlTask final : public UrlTask, public std::enable_shared_from_this<CurlTask> {
public:
    CurlTask(std::shared_ptr<CurlTaskRunner> runner, std::uint64_t identifier, UrlRequest request,
             UrlSessionConfiguration configuration, UrlSession::DataCompletion completion,
             std::shared_ptr<Queue> delegateQueue, std::optional<TransferFiles> files = std::nullopt)
        : _runner(std::move(runner)), _identifier(identifier), _request(std::move(request)),
          _configuration(std::move(configuration)), _completion(std::move(completion)),
          _delegateQueue(std::move(delegateQueue)), _files(std::move(files))
    {}
    ~CurlTask() override { curl_slist_free_all(_headerList); }

    void resume() override
    {
        if (!_started.exchange(true)) _runner->start(shared_from_this());
    }
    void cancel() override
    {
        _cancelled = true;
        if (_started.exchange(true))
            _runner->cancel(shared_from_this());
        else
            deliver(completion(CURLE_OK, true));
    }
    /// Hands a completion on.
    void deliver(Queue::Task completion) { _delegateQueue->async(std::move(completion)); }
    void deliverHere(Queue::Task completion) { _delegateQueue->asyncHere(std::move(completion)); }
    /// True for a task that was cancelled before the loader began it.
    [[nodiscard]] bool cancelled() const { return _cancelled; }
    [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
    [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
    [[nodiscard]] Value timingData() const override
    {
        std::lock_guard lock(_timingMutex);
        return _timing;
    }

    /// Sets the transfer up. With the multi handle held, like all below.
    [[nodiscard]] bool configure(CURL* handle);
    /// The end of the task: the call of its completion, to be delivered.
    [[nodiscard]] Queue::Task completion(CURLcode code, bool cancelled);
    [[nodiscard]] CURL* easy() const { return _easy; }

    /// When the task times out for having received nothing.
    [[nodiscard]] std::chrono::steady_clock::time_point deadline() const { return _lastProgress + timeout(); }
    bool timedOut = false;

private:
    [[nodiscard]] Duration timeout() const { return _request.timeout.value_or(_configuration.requestTimeout); }
    void progressed() { _lastProgress = std::chrono::steady_clock::now(); }
    std::size_t received(std::string_view bytes);
    bool store(std::string_view bytes);
    void forgetBody();
    std::size_t receivedHeader(std::string_view line);
    [[nodiscard]] bool configureUpload();
    std::size_t readUpload(char* buffer, std::size_t size);
    int mayConnect(const char* address);
    [[nodiscard]] long hop() const;
    void noteMarks();
    [[nodiscard]] Error unsupported() const;

    std::shared_ptr<CurlTaskRunner> _runner;
    const std::uint64_t _identifier;
    const UrlRequest _request;
    const UrlSessionConfiguration _configuration;
    UrlSession::DataCompletion _completion;
    std::shared_ptr<Queue> _delegateQueue;
    const std::optional<TransferFiles> _files;
    std::atomic<bool> _started = false; // handed to the loader, or ended without it
    std::atomic<bool> _cancelled = false;

    CURL* _easy = nullptr;
    curl_slist* _headerList = nullptr;
    std::chrono::steady_clock::time_point _lastProgress;
    double _start = 0; // on the monotonic clock
    std::string _body;
    std::size_t _bodySize = 0; // what was received, whether it is in memory or not
    std::uint64_t _uploaded = 0;
    std::uint64_t _uploadSize = 0;
    int _fileError = 0; // errno
    HttpHeaders _headers;
    std::size_t _headerSize = 0; // of all hops
    bool _tooLarge = false;
    std::optional<long> _sentHop; // the last hop whose request was sent
    long _markedHop = 0;
    TransferMarks _marks;       // by the end of that hop
    TransferMarks _earlierHops; // by the end of the one before
    std::optional<bool> _firstHopPublic;
    bool _forbiddenHop = false;
    std::array<char, CURL_ERROR_SIZE> _errorText{};

    mutable std::mutex _timingMutex;
    Value _timing; // under the mutex
};

} // namespace platform
