#include "platform/net/UrlSessionCaching.h"

#include <utility>

#include "platform/base/Mutex.h"
#include "platform/net/CurlSupport.h"
#include "platform/net/HttpCache.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"

namespace platform {

namespace {

using Stored = std::shared_ptr<const StoredResponse>;

/// Stores the response if HTTP allows it.
void fill(HttpCache& cache, const UrlRequest& request, const Bytes& data, const UrlResponse& response, Date requested,
          bool hadStored)
{
    // After a redirect the response is stored under the last URL, not under the request's.
    const Date received = cache.now();
    if (isStorable(request, response, received)) {
        StoredResponse stored;
        stored.response = response;
        stored.body = data;
        stored.selecting = selectingFields(response, request).value_or("");
        stored.requested = requested;
        stored.received = received;
        cache.store(response.url, std::move(stored));
    } else if (hadStored && response.statusCode < 400) {
        cache.remove(request.url); // the new response supersedes it
    }
}

/// Returns the response with its body in memory. A mapped file may change while the task's owner, or a revalidation,
/// still reads it.
Stored inMemory(Stored stored)
{
    if (!stored->mapped) return stored;
    auto copy = std::make_shared<StoredResponse>(*stored);
    copy->body = Bytes(std::string(stored->body.view()));
    copy->mapped = false;
    return copy;
}

/// Returns the timing data of a cached response: `start`, and now as its end.
Value timingFromCache(double start)
{
    const double end = monotonicSeconds();
    return Dictionary{{"_kCFNTimingDataFetchStart", start},    {"_kCFNTimingDataRedirectStart", 0.0},
                      {"_kCFNTimingDataRedirectEnd", 0.0},     {"_kCFNTimingDataDomainLookupStart", 0.0},
                      {"_kCFNTimingDataDomainLookupEnd", 0.0}, {"_kCFNTimingDataConnectStart", 0.0},
                      {"_kCFNTimingDataConnectEnd", 0.0},      {"_kCFNTimingDataSecureConnectionStart", 0.0},
                      {"_kCFNTimingDataRequestStart", 0.0},    {"_kCFNTimingDataResponseStart", 0.0},
                      {"_kCFNTimingDataResponseEnd", end},     {"_kCFNTimingDataConnectionReused", false}};
}

/// A task that reads the cache first. The thread that sets the state to Ended under the mutex runs the completion:
///
///     suspended ──resume──► asking ──nothing, or stale──► loading ──► ended
///         └──────cancel──────┴──fresh, or cancel────────────────────────┘
///
/// During Loading, `cancel` cancels the load. A 304 that doesn't match the cached response is followed by a load
/// without conditions.
class CachingTask final : public UrlTask, public std::enable_shared_from_this<CachingTask> {
public:
    CachingTask(std::shared_ptr<UrlSession> loads, std::shared_ptr<HttpCache> cache,
                std::shared_ptr<Queue> delegateQueue, UrlRequest request, UrlSession::DataCompletion completion)
        : _loads(std::move(loads)), _cache(std::move(cache)), _delegateQueue(std::move(delegateQueue)),
          _request(std::move(request)), _completion(std::move(completion))
    {}
    /// Creates the load, whose identifier becomes the task's. Call it once, first.
    void prepare()
    {
        auto load = makeLoad(_request);
        _identifier = load->identifier();
        MutexLock lock(_mutex);
        _load = std::move(load);
    }

    void resume() override
    {
        {
            MutexLock lock(_mutex);
            if (_state != State::Suspended) return;
            _state = State::Asking;
        }
        _start = monotonicSeconds();
        _cache->lookUp(_request.url, [self = shared_from_this()](Stored stored) { self->lookedUp(std::move(stored)); });
    }

    void cancel() override
    {
        std::shared_ptr<UrlTask> load;
        {
            MutexLock lock(_mutex);
            _cancelled = true;
            if (_state == State::Loading) load = _load;
        }
        if (load) return load->cancel();
        end(std::nullopt, std::nullopt, urlError(kUrlCancelled, "cancelled"), Value());
    }

    [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
    [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
    [[nodiscard]] Value timingData() const override
    {
        MutexLock lock(_mutex);
        return _timing;
    }

private:
    enum class State { Suspended, Asking, Loading, Ended };

    [[nodiscard]] std::shared_ptr<UrlTask> makeLoad(UrlRequest request)
    {
        // Weak: a load that is never resumed never releases its completion.
        return _loads->dataTask(std::move(request), [weak = weak_from_this()](auto data, auto response, auto error) {
            if (const auto self = weak.lock()) self->loaded(std::move(data), std::move(response), std::move(error));
        });
    }

    void lookedUp(Stored stored)
    {
        const Reuse worth = stored ? reuse(*stored, _request, _cache->now()) : Reuse::None;
        if (worth != Reuse::None) stored = inMemory(std::move(stored));
        if (worth == Reuse::Answer) return end(stored->body, stored->response, std::nullopt, timingFromCache(_start));
        _stored = std::move(stored);
        _confirming = worth == Reuse::Confirm;
        load(_confirming ? makeLoad(confirmationRequest(*_stored, _request)) : nullptr);
    }

    /// Starts `other`, or if null the load that `prepare` created.
    void load(std::shared_ptr<UrlTask> other)
    {
        std::shared_ptr<UrlTask> resumed;
        _requested = _cache->now();
        {
            MutexLock lock(_mutex);
            if (_state == State::Ended || _cancelled) return; // `cancel` completes it
            _state = State::Loading;
            if (other) _load = std::move(other);
            _self = shared_from_this();
            resumed = _load;
        }
        resumed->resume();
    }

    /// Runs on the delegate queue.
    void loaded(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error)
    {
        std::shared_ptr<UrlTask> finished;
        {
            MutexLock lock(_mutex);
            finished = _load;
        }
        if (!error && data && response) {
            const bool direct = cacheKey(response->url) == cacheKey(_request.url);
            if (_confirming && response->statusCode == 304) {
                if (!direct || !confirms(*response, *_stored)) return loadUnconditionally();
                const StoredResponse stored = confirmed(*_stored, *response, _requested, _cache->now());
                if (isStorable(_request, stored.response, stored.received))
                    _cache->store(_request.url, stored);
                else
                    _cache->remove(_request.url);
                data = stored.body;
                response = stored.response;
            } else {
                fill(*_cache, _request, *data, *response, _requested, _stored && direct);
            }
        }
        finish(std::move(data), std::move(response), std::move(error), finished->timingData());
    }

    void loadUnconditionally()
    {
        _confirming = false;
        auto again = makeLoad(_request);
        bool cancelled = false;
        {
            MutexLock lock(_mutex);
            _load = std::move(again);
            cancelled = _cancelled;
        }
        if (cancelled) return finish(std::nullopt, std::nullopt, urlError(kUrlCancelled, "cancelled"), Value());
        load(nullptr);
    }

    /// Completes the task inline. Only called by the load's completion, on the delegate queue.
    void finish(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error,
                Value timing)
    {
        std::shared_ptr<CachingTask> self;
        {
            MutexLock lock(_mutex);
            _state = State::Ended;
            _timing = std::move(timing);
            self = std::move(_self);
        }
        _stored.reset();
        auto completion = std::exchange(_completion, {});
        completion(std::move(data), std::move(response), std::move(error));
    }

    /// Completes the task on the delegate queue, unless it is loading or has ended.
    void end(std::optional<Bytes> data, std::optional<UrlResponse> response, std::optional<Error> error, Value timing)
    {
        {
            MutexLock lock(_mutex);
            if (_state == State::Loading || _state == State::Ended) return;
            _state = State::Ended;
            _timing = std::move(timing);
        }
        _delegateQueue->async([self = shared_from_this(), data = std::move(data), response = std::move(response),
                               error = std::move(error)]() mutable {
            // Moved out first: the completion may own the owner of this task.
            auto completion = std::exchange(self->_completion, {});
            completion(std::move(data), std::move(response), std::move(error));
        });
    }

    const std::shared_ptr<UrlSession> _loads;
    const std::shared_ptr<HttpCache> _cache;
    const std::shared_ptr<Queue> _delegateQueue;
    const UrlRequest _request;
    std::uint64_t _identifier = 0;
    UrlSession::DataCompletion _completion; // used by the thread that ends the task
    double _start = 0;                      // this and the next three are set before the step that reads them
    Stored _stored;
    bool _confirming = false;
    Date _requested;

    mutable Mutex _mutex;
    State _state GUARDED_BY(_mutex) = State::Suspended;
    bool _cancelled GUARDED_BY(_mutex) = false;
    std::shared_ptr<UrlTask> _load GUARDED_BY(_mutex);
    std::shared_ptr<CachingTask> _self GUARDED_BY(_mutex); ///< while it is loading
    Value _timing GUARDED_BY(_mutex);
};

class CachingSession final : public UrlSession {
public:
    CachingSession(std::shared_ptr<UrlSession> loads, std::shared_ptr<HttpCache> cache,
                   std::shared_ptr<Queue> delegateQueue)
        : _loads(std::move(loads)), _cache(std::move(cache)), _delegateQueue(std::move(delegateQueue))
    {}

    std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override
    {
        switch (cacheUse(request)) {
        case CacheUse::None: break;
        case CacheUse::Ask: {
            auto task = std::make_shared<CachingTask>(_loads, _cache, _delegateQueue, std::move(request),
                                                      std::move(completion));
            task->prepare();
            return task;
        }
        case CacheUse::Fill: completion = filling(request, std::move(completion)); break;
        case CacheUse::Invalidate: completion = invalidating(request.url, std::move(completion)); break;
        }
        return _loads->dataTask(std::move(request), std::move(completion));
    }
    std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files, DataCompletion completion) override
    {
        if (cacheUse(request) == CacheUse::Invalidate) completion = invalidating(request.url, std::move(completion));
        return _loads->transferTask(std::move(request), std::move(files), std::move(completion));
    }
    [[nodiscard]] std::shared_ptr<HttpCache> cache() const override { return _cache; }

private:
    [[nodiscard]] DataCompletion filling(const UrlRequest& request, DataCompletion completion) const
    {
        return [cache = _cache, request, requested = _cache->now(),
                completion = std::move(completion)](auto data, auto response, auto error) mutable {
            if (!error && data && response)
                fill(*cache, request, *data, *response, requested, cacheKey(response->url) == cacheKey(request.url));
            completion(std::move(data), std::move(response), std::move(error));
        };
    }
    [[nodiscard]] DataCompletion invalidating(const Url& url, DataCompletion completion) const
    {
        return [cache = _cache, url, completion = std::move(completion)](auto data, auto response, auto error) mutable {
            if (!error && response) {
                const bool redirected = cacheKey(response->url) != cacheKey(url);
                const bool done = response->statusCode >= 200 && response->statusCode < 400;
                if (done || redirected) cache->remove(url);
                if (done && redirected) cache->remove(response->url);
            }
            completion(std::move(data), std::move(response), std::move(error));
        };
    }

    const std::shared_ptr<UrlSession> _loads;
    const std::shared_ptr<HttpCache> _cache;
    const std::shared_ptr<Queue> _delegateQueue;
};

} // namespace

std::shared_ptr<UrlSession> makeCachingSession(std::shared_ptr<UrlSession> loads, std::shared_ptr<HttpCache> cache,
                                               std::shared_ptr<Queue> delegateQueue)
{
    return std::make_shared<CachingSession>(std::move(loads), std::move(cache), std::move(delegateQueue));
}

} // namespace platform
