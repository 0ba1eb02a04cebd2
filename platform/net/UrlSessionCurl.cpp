#include "platform/net/UrlSessionCurl.h"

#include <algorithm>
#include <arpa/inet.h>
#include <atomic>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <deque>
#include <mutex>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include <curl/curl.h>
#include <fmt/format.h>
#include <openssl/ssl.h>

#include "platform/base/ThreadName.h"
#include "platform/net/CurlSupport.h"
#include "platform/net/HttpCache.h"
#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCaching.h"
#include "platform/run/Queue.h"

namespace platform {

namespace {

/// Of one load, over all its hops. libcurl refuses a single line beyond 100 KiB.
constexpr std::size_t kMaximumHeaderSize = 256u << 10;

class CurlTask;

/// The URL-loading thread. Everything with "loader thread" in its comment belongs to it alone.
class Loader : public std::enable_shared_from_this<Loader> {
public:
    Loader() : _multi(curl_multi_init()) {}
    ~Loader();

    void start(std::shared_ptr<CurlTask> task);
    void cancel(std::shared_ptr<CurlTask> task);
    /// Ends every task and the thread.
    void stop();

private:
    struct Command {
        std::shared_ptr<CurlTask> task;
        bool cancel;
    };
    void run();
    void takeCommands();
    void begin(const std::shared_ptr<CurlTask>& task);
    void end(CURL* easy, CURLcode code, bool cancelled);
    [[nodiscard]] CURL* takeEasy();
    [[nodiscard]] int nextTimeout();
    [[nodiscard]] bool readOn();

    CURLM* _multi;
    std::mutex _mutex;
    std::vector<Command> _commands;                     // under the mutex
    bool _stopping = false;                             // under the mutex
    std::thread _thread;                                // made under the mutex
    std::map<CURL*, std::shared_ptr<CurlTask>> _active; // loader thread
    std::vector<CURL*> _spare;                          // loader thread
};

/// One load. The loader thread fills it in; the completion hands the results on.
class CurlTask final : public UrlTask, public std::enable_shared_from_this<CurlTask> {
public:
    CurlTask(std::shared_ptr<Loader> loader, std::uint64_t identifier, UrlRequest request,
             UrlSessionConfiguration configuration, UrlSession::DataCompletion completion,
             std::shared_ptr<Queue> delegateQueue, std::optional<TransferFiles> files = std::nullopt)
        : _loader(std::move(loader)), _identifier(identifier), _request(std::move(request)),
          _configuration(std::move(configuration)), _completion(std::move(completion)),
          _delegateQueue(std::move(delegateQueue)), _files(std::move(files))
    {}
    ~CurlTask() override { curl_slist_free_all(_headerList); }

    void resume() override
    {
        if (!_started.exchange(true)) _loader->start(shared_from_this());
    }
    void cancel() override
    {
        _cancelled = true;
        if (_started.exchange(true))
            _loader->cancel(shared_from_this());
        else
            complete(CURLE_OK, true);
    }
    /// True for a task that was cancelled before the loader began it.
    [[nodiscard]] bool cancelled() const { return _cancelled; }
    [[nodiscard]] std::uint64_t identifier() const override { return _identifier; }
    [[nodiscard]] const UrlRequest& originalRequest() const override { return _request; }
    [[nodiscard]] Value timingData() const override
    {
        std::lock_guard lock(_timingMutex);
        return _timing;
    }

    /// Sets the transfer up. Loader thread, like all below.
    [[nodiscard]] bool configure(CURL* handle);
    void complete(CURLcode code, bool cancelled);
    [[nodiscard]] CURL* easy() const { return _easy; }

    /// Milliseconds until the task times out for having received nothing; none while it isn't sent.
    [[nodiscard]] std::chrono::milliseconds timeLeft(std::chrono::steady_clock::time_point now) const
    {
        return std::chrono::ceil<std::chrono::milliseconds>(_lastProgress + timeout() - now);
    }
    bool timedOut = false;

private:
    [[nodiscard]] Duration timeout() const { return _request.timeout.value_or(_configuration.requestTimeout); }
    [[nodiscard]] std::size_t maximumSize() const
    {
        return _request.maximumResponseSize.value_or(_configuration.maximumResponseSize);
    }
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

    std::shared_ptr<Loader> _loader;
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
    bool _headersEnded = false; // of this hop; what comes behind its body is no header field
    bool _wasPublic = false;    // one of the hops
    bool _forbiddenHop = false;
    std::array<char, CURL_ERROR_SIZE> _errorText{};

    mutable std::mutex _timingMutex;
    Value _timing; // under the mutex
};

std::size_t CurlTask::received(std::string_view bytes)
{
    progressed();
    if (_bodySize + bytes.size() > maximumSize()) {
        _tooLarge = true;
        return 0;
    }
    if (_files) {
        if (!store(bytes)) return 0;
    } else {
        if (_body.empty()) {
            curl_off_t length = -1;
            curl_easy_getinfo(_easy, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &length);
            const auto expected = static_cast<std::size_t>(std::max<curl_off_t>(length, 0));
            _body.reserve(std::min(expected, maximumSize()));
        }
        _body.append(bytes);
    }
    _bodySize += bytes.size();
    return bytes.size();
}

bool CurlTask::store(std::string_view bytes)
{
    if (!_files->download) return true;
    for (std::size_t written = 0; written < bytes.size();) {
        const ssize_t count = pwrite(_files->download.fd(), bytes.data() + written, bytes.size() - written,
                                     static_cast<off_t>(_bodySize + written));
        if (count < 0 && errno != EINTR) {
            _fileError = errno;
            return false;
        }
        if (count > 0) written += static_cast<std::size_t>(count);
    }
    return true;
}

/// The body of a redirect isn't the answer's.
void CurlTask::forgetBody()
{
    _body.clear();
    if (_bodySize > 0 && _files && _files->download && ftruncate(_files->download.fd(), 0) != 0) _fileError = errno;
    _bodySize = 0;
}

std::size_t CurlTask::readUpload(char* buffer, std::size_t size)
{
    progressed();
    ssize_t count = -1;
    do count = pread(_files->upload.fd(), buffer, size, static_cast<off_t>(_uploaded));
    while (count < 0 && errno == EINTR);
    // A file that became shorter must not be sent as if it were whole.
    if (count < 0 || (count == 0 && size > 0 && _uploaded < _uploadSize)) {
        _fileError = count < 0 ? errno : EIO;
        return CURL_READFUNC_ABORT;
    }
    _uploaded += static_cast<std::uint64_t>(count);
    if (_files->progress && count > 0) _files->progress(_uploaded, _uploadSize);
    return static_cast<std::size_t>(count);
}

std::size_t CurlTask::receivedHeader(std::string_view line)
{
    progressed();
    _headerSize += line.size();
    if (_headerSize > kMaximumHeaderSize) {
        _tooLarge = true;
        return 0;
    }
    if (line.starts_with("HTTP/")) {
        noteMarks();
        _headers = {}; // of a redirect, or of an interim answer
        _headersEnded = false;
        forgetBody();
        return line.size();
    }
    if (line == "\r\n" || line == "\n") _headersEnded = true;
    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos || _headersEnded) return line.size();
    std::string_view value = line.substr(colon + 1);
    const auto isBlank = [](char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; };
    while (!value.empty() && isBlank(value.front())) value.remove_prefix(1);
    while (!value.empty() && isBlank(value.back())) value.remove_suffix(1);
    _headers.add(std::string(line.substr(0, colon)), std::string(value));
    return line.size();
}

long CurlTask::hop() const
{
    long redirects = 0;
    curl_easy_getinfo(_easy, CURLINFO_REDIRECT_COUNT, &redirects);
    return redirects;
}

/// libcurl adds up the marks of all hops; what the earlier ones took is kept, to be subtracted.
void CurlTask::noteMarks()
{
    if (const long now = hop(); now != _markedHop) {
        _markedHop = now;
        _earlierHops = _marks;
    }
    _marks = transferMarks(_easy);
}

/// libcurl has one code for three faults.
Error CurlTask::unsupported() const
{
    if (!_sentHop) return urlErrorFromCurl(CURLE_UNSUPPORTED_PROTOCOL, _errorText.data());
    if (hop() > *_sentHop)
        return urlError(kUrlForbiddenRedirect, fmt::format("redirected to another scheme: {}", _errorText.data()));
    return urlError(kUrlBadResponse, fmt::format("the answer isn't HTTP: {}", _errorText.data()));
}

/// A public host must not lead us, by redirects, to an address of the inner network.
int CurlTask::mayConnect(const char* address)
{
    _sentHop = hop();
    const bool isPublic = isPublicAddress(address);
    _forbiddenHop = _wasPublic && !isPublic;
    _wasPublic = _wasPublic || isPublic;
    return _forbiddenHop ? CURL_PREREQFUNC_ABORT : CURL_PREREQFUNC_OK;
}

bool CurlTask::configureUpload()
{
    struct stat status{};
    if (fstat(_files->upload.fd(), &status) != 0) {
        _fileError = errno;
        return false;
    }
    _uploadSize = static_cast<std::uint64_t>(status.st_size);
    curl_easy_setopt(_easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_uploadSize));
    curl_easy_setopt(_easy, CURLOPT_READDATA, this);
    curl_easy_setopt(
        _easy, CURLOPT_READFUNCTION, +[](char* buffer, std::size_t size, std::size_t count, void* self) {
            return static_cast<CurlTask*>(self)->readUpload(buffer, size * count);
        });
    // From its start, for a redirect that repeats the body and for a connection that turned out to be closed.
    curl_easy_setopt(_easy, CURLOPT_SEEKDATA, this);
    curl_easy_setopt(
        _easy, CURLOPT_SEEKFUNCTION, +[](void* self, curl_off_t offset, int origin) {
            if (origin != SEEK_SET || offset < 0) return CURL_SEEKFUNC_FAIL;
            static_cast<CurlTask*>(self)->_uploaded = static_cast<std::uint64_t>(offset);
            return CURL_SEEKFUNC_OK;
        });
    return true;
}

bool CurlTask::configure(CURL* handle)
{
    _easy = handle;
    _start = monotonicSeconds();
    progressed();
    const auto set = [handle](CURLoption option, auto value) {
        return curl_easy_setopt(handle, option, value) == CURLE_OK;
    };

    set(CURLOPT_ERRORBUFFER, _errorText.data());
    set(CURLOPT_NOSIGNAL, 1L);
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    set(CURLOPT_REDIR_PROTOCOLS_STR, "http,https");
    set(CURLOPT_FOLLOWLOCATION, 1L);
    set(CURLOPT_MAXREDIRS, static_cast<long>(_configuration.maximumRedirects));
    set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_2TLS));
    set(CURLOPT_PIPEWAIT, _configuration.pipelining ? 1L : 0L);
    set(CURLOPT_TCP_FASTOPEN, _configuration.allowFastOpenAndTickets ? 1L : 0L);
    set(CURLOPT_SSL_SESSIONID_CACHE, _configuration.allowFastOpenAndTickets ? 1L : 0L);
    set(CURLOPT_ACCEPT_ENCODING, "");
    if (_configuration.connectionPurgeTimeout)
        set(CURLOPT_MAXAGE_CONN, static_cast<long>(toSeconds(*_configuration.connectionPurgeTimeout)));
    if (!_configuration.caFile.empty()) set(CURLOPT_CAINFO, _configuration.caFile.c_str());
    if (_configuration.allowFastOpenAndTickets) {
        // libcurl switches session tickets off; they save a round trip on every new connection.
        set(
            CURLOPT_SSL_CTX_FUNCTION, +[](CURL*, void* context, void*) -> CURLcode {
                SSL_CTX_clear_options(static_cast<SSL_CTX*>(context), SSL_OP_NO_TICKET);
                return CURLE_OK;
            });
    }
    set(CURLOPT_WRITEDATA, this);
    set(
        CURLOPT_WRITEFUNCTION, +[](char* data, std::size_t, std::size_t count, void* self) {
            return static_cast<CurlTask*>(self)->received({data, count});
        });
    set(CURLOPT_HEADERDATA, this);
    set(
        CURLOPT_HEADERFUNCTION, +[](char* data, std::size_t, std::size_t count, void* self) {
            return static_cast<CurlTask*>(self)->receivedHeader({data, count});
        });
    set(CURLOPT_PREREQDATA, this);
    set(
        CURLOPT_PREREQFUNCTION,
        +[](void* self, char* address, char*, int, int) { return static_cast<CurlTask*>(self)->mayConnect(address); });

    for (const auto& [name, value] : _request.headers) {
        // "Name;" is how libcurl is told to send an empty field.
        const std::string line = value.empty() ? name + ";" : name + ": " + value;
        if (line.find_first_of("\r\n") != std::string::npos) continue;
        curl_slist* extended = curl_slist_append(_headerList, line.c_str());
        if (extended) _headerList = extended;
    }
    const bool hasUpload = _files && _files->upload;
    const bool hasBody = hasUpload || !_request.body.empty() || _request.method == "POST";
    if (hasBody) {
        set(CURLOPT_POST, 1L);
        if (hasUpload) {
            if (!configureUpload()) return false;
        } else {
            set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_request.body.size()));
            set(CURLOPT_POSTFIELDS, _request.body.empty() ? "" : _request.body.data());
        }
        curl_slist* extended = curl_slist_append(_headerList, "Expect:");
        if (extended) _headerList = extended;
    }
    if (_request.method == "HEAD") set(CURLOPT_NOBODY, 1L);
    // Only where it must be: libcurl keeps to a method that was forced, even where a redirect turns POST into GET.
    else if (_request.method != (hasBody ? "POST" : "GET"))
        set(CURLOPT_CUSTOMREQUEST, _request.method.c_str());
    set(CURLOPT_HTTPHEADER, _headerList);
    return set(CURLOPT_URL, _request.url.string().c_str());
}

void CurlTask::complete(CURLcode code, bool cancelled)
{
    std::optional<UrlResponse> response;
    std::optional<Bytes> data;
    std::optional<Error> error;

    if (cancelled)
        error = urlError(kUrlCancelled, "cancelled");
    else if (timedOut)
        error = urlError(kUrlTimedOut, fmt::format("nothing received for {:g} s", toSeconds(timeout())));
    else if (_tooLarge)
        error = urlError(kUrlTooLarge, _headerSize > kMaximumHeaderSize
                                           ? fmt::format("more than {} bytes of header fields", kMaximumHeaderSize)
                                           : fmt::format("more than {} bytes", maximumSize()));
    else if (_forbiddenHop)
        error = urlError(kUrlForbiddenRedirect, "redirected to a private address");
    else if (_fileError != 0)
        error = Error::posix(_fileError, "a transfer's file");
    else if (code == CURLE_UNSUPPORTED_PROTOCOL)
        error = unsupported();
    else if (code != CURLE_OK)
        error = urlErrorFromCurl(code, _errorText.data());

    if (_easy && !cancelled) {
        long status = 0;
        char* url = nullptr; // which libcurl may have written otherwise than we did
        curl_easy_getinfo(_easy, CURLINFO_RESPONSE_CODE, &status);
        if (hop() > 0) curl_easy_getinfo(_easy, CURLINFO_EFFECTIVE_URL, &url);
        if (status > 0) {
            response = UrlResponse{.url = url ? Url::parse(url).value_or(_request.url) : _request.url,
                                   .isHttp = true,
                                   .statusCode = static_cast<int>(status),
                                   .headers = std::move(_headers)};
        }
        noteMarks();
        std::lock_guard lock(_timingMutex);
        _timing = timingDataOf(_easy, _start, _earlierHops);
    }
    if (!error) data = Bytes(std::move(_body));
    _easy = nullptr;
    _delegateQueue->async([self = shared_from_this(), data = std::move(data), response = std::move(response),
                           error = std::move(error)]() mutable {
        // Moved out first: the completion may be what keeps the task's owner alive.
        auto completion = std::exchange(self->_completion, {});
        completion(std::move(data), std::move(response), std::move(error));
    });
}

Loader::~Loader()
{
    stop();
    curl_multi_cleanup(_multi);
}

void Loader::start(std::shared_ptr<CurlTask> task)
{
    {
        std::lock_guard lock(_mutex);
        if (!_stopping) {
            _commands.push_back({std::move(task), false});
            if (!_thread.joinable()) _thread = std::thread([this] { run(); });
        }
    }
    if (task) return task->complete(CURLE_OK, true);
    curl_multi_wakeup(_multi);
}

void Loader::cancel(std::shared_ptr<CurlTask> task)
{
    {
        std::lock_guard lock(_mutex);
        if (_stopping) return;
        _commands.push_back({std::move(task), true});
    }
    curl_multi_wakeup(_multi);
}

void Loader::stop()
{
    {
        std::lock_guard lock(_mutex);
        _stopping = true;
        if (!_thread.joinable()) return;
    }
    curl_multi_wakeup(_multi);
    _thread.join();
}

CURL* Loader::takeEasy()
{
    if (_spare.empty()) return curl_easy_init();
    CURL* easy = _spare.back();
    _spare.pop_back();
    return easy;
}

void Loader::takeCommands()
{
    std::vector<Command> commands;
    {
        std::lock_guard lock(_mutex);
        commands.swap(_commands);
    }
    for (Command& command : commands) {
        if (!command.cancel)
            begin(command.task);
        else if (command.task->easy())
            end(command.task->easy(), CURLE_OK, true);
    }
}

void Loader::begin(const std::shared_ptr<CurlTask>& task)
{
    if (task->cancelled()) return task->complete(CURLE_OK, true);
    CURL* easy = takeEasy();
    if (!easy || !task->configure(easy) || curl_multi_add_handle(_multi, easy) != CURLM_OK) {
        task->complete(CURLE_FAILED_INIT, false);
        if (easy) curl_easy_cleanup(easy);
        return;
    }
    _active.emplace(easy, task);
}

void Loader::end(CURL* easy, CURLcode code, bool cancelled)
{
    const auto found = _active.find(easy);
    if (found == _active.end()) return;
    const std::shared_ptr<CurlTask> task = std::move(found->second);
    _active.erase(found);
    task->complete(code, cancelled);
    curl_multi_remove_handle(_multi, easy);
    constexpr std::size_t kSpareHandles = 8;
    if (_spare.size() < kSpareHandles) {
        curl_easy_reset(easy);
        _spare.push_back(easy);
    } else {
        curl_easy_cleanup(easy);
    }
}

/// Ends what has received nothing for too long, and answers how long to wait for the next such moment.
int Loader::nextTimeout()
{
    const auto now = std::chrono::steady_clock::now();
    std::vector<CURL*> late;
    std::chrono::milliseconds shortest(std::chrono::hours(1));
    for (const auto& [easy, task] : _active) {
        const auto left = task->timeLeft(now);
        if (left.count() <= 0)
            late.push_back(easy);
        else
            shortest = std::min(shortest, left);
    }
    for (CURL* easy : late) {
        _active.at(easy)->timedOut = true;
        end(easy, CURLE_OPERATION_TIMEDOUT, false);
    }
    // Without a task there is nothing to wake for: start and cancel interrupt the wait.
    return _active.empty() ? std::numeric_limits<int>::max() : static_cast<int>(shortest.count());
}

/// Has every transfer look at what has been read for it; whether one of them received something. With HTTP/2 libcurl
/// 7.88 reads for all streams of a connection at once, and may leave the end of one until the connection has more:
/// without this, of 40 lists of 24 images seven had some that hung. Resuming what is paused makes libcurl read for one
/// transfer of the connection in its next round.
bool Loader::readOn()
{
    const auto received = [this] {
        curl_off_t all = 0;
        for (const auto& [easy, task] : _active) {
            curl_off_t size = 0;
            long headers = 0;
            curl_easy_getinfo(easy, CURLINFO_SIZE_DOWNLOAD_T, &size);
            curl_easy_getinfo(easy, CURLINFO_HEADER_SIZE, &headers);
            all += size + headers;
        }
        return all;
    };
    const curl_off_t before = received();
    int running = 0;
    for (const auto& [easy, task] : _active) {
        curl_easy_pause(easy, CURLPAUSE_RECV);
        curl_easy_pause(easy, CURLPAUSE_CONT);
        curl_multi_perform(_multi, &running);
    }
    return received() != before;
}

void Loader::run()
{
    constexpr int kQuiet = 2; // milliseconds
    bool isQuiet = false;
    bool mayBeUnread = false; // something was read, perhaps, for a transfer that hasn't seen it
    setThreadNameForLabel("url-loader");
    while (true) {
        {
            std::lock_guard lock(_mutex);
            if (_stopping) break;
        }
        takeCommands();
        mayBeUnread = mayBeUnread || (!isQuiet && _active.size() > 1);
        int running = 0;
        curl_multi_perform(_multi, &running);
        int left = 0;
        while (const CURLMsg* message = curl_multi_info_read(_multi, &left))
            if (message->msg == CURLMSG_DONE) end(message->easy_handle, message->data.result, false);
        const int timeout = nextTimeout();
        int ready = 0;
        curl_multi_poll(_multi, nullptr, 0, mayBeUnread ? std::min(timeout, kQuiet) : timeout, &ready);
        isQuiet = mayBeUnread && ready == 0;
        if (isQuiet) mayBeUnread = readOn();
    }
    takeCommands();
    while (!_active.empty()) end(_active.begin()->first, CURLE_OK, true);
    for (CURL* easy : _spare) curl_easy_cleanup(easy);
    _spare.clear();
}

class CurlSession final : public UrlSession {
public:
    CurlSession(std::shared_ptr<Loader> loader, UrlSessionConfiguration configuration, std::shared_ptr<Queue> queue)
        : _loader(std::move(loader)), _configuration(std::move(configuration)), _queue(std::move(queue))
    {}
    std::shared_ptr<UrlTask> dataTask(UrlRequest request, DataCompletion completion) override
    {
        return std::make_shared<CurlTask>(_loader, ++_lastIdentifier, std::move(request), _configuration,
                                          std::move(completion), _queue);
    }
    std::shared_ptr<UrlTask> transferTask(UrlRequest request, TransferFiles files, DataCompletion completion) override
    {
        return std::make_shared<CurlTask>(_loader, ++_lastIdentifier, std::move(request), _configuration,
                                          std::move(completion), _queue, std::move(files));
    }

private:
    std::shared_ptr<Loader> _loader;
    const UrlSessionConfiguration _configuration;
    std::shared_ptr<Queue> _queue;
    std::atomic<std::uint64_t> _lastIdentifier = 0;
};

class CurlLoader final : public UrlLoader {
public:
    ~CurlLoader() override { _loader->stop(); }
    std::shared_ptr<UrlSession> makeSession(UrlSessionConfiguration configuration,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        const auto kept = std::exchange(configuration.cache, std::nullopt);
        auto session = std::make_shared<CurlSession>(_loader, std::move(configuration), delegateQueue);
        if (!kept) return session;
        return makeCachingSession(std::move(session), HttpCache::make(*kept), std::move(delegateQueue));
    }

private:
    std::shared_ptr<Loader> _loader = std::make_shared<Loader>();
};

} // namespace

std::unique_ptr<UrlLoader> makeCurlLoader()
{
    static std::once_flag once;
    std::call_once(once, [] { curl_global_init(CURL_GLOBAL_DEFAULT); });
    return std::make_unique<CurlLoader>();
}

} // namespace platform
