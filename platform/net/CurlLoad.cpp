#include "platform/net/CurlLoad.h"

#include <algorithm>
#include <cerrno>
#include <netdb.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include <fmt/format.h>
#include <openssl/ssl.h>

#include "platform/net/UrlRedirect.h"

namespace platform {

namespace {

/// Bytes of header fields of one load, over all hops. libcurl refuses a single line beyond 100 KiB.
constexpr std::size_t kMaximumHeaderSize = 256u << 10;

/// The largest receive buffer that libcurl allows. Memory is only used for what is received.
constexpr std::size_t kLargestBuffer = CURL_MAX_READ_SIZE;
/// Receive buffer over HTTP/1.1: an ordinary answer takes one or two reads. libcurl polls before each.
constexpr std::size_t kOrdinaryBuffer = 64u << 10;

} // namespace

CurlLoad::CurlLoad(const UrlRequest& request, const UrlSessionConfiguration& configuration, const TransferFiles* files,
                   std::size_t& inMemory)
    : _request(request), _configuration(configuration), _files(files), _inMemory(inMemory), _hop(request)
{
    if (auto allowed = withinSource(request))
        _hop = std::move(*allowed);
    else
        _error = std::move(allowed.error());
}

CurlLoad::~CurlLoad()
{
    _inMemory -= _body.size();
    curl_slist_free_all(_headerList);
}

std::size_t CurlLoad::maximumSize() const
{
    return _request.maximumResponseSize.value_or(_configuration.maximumResponseSize);
}

bool CurlLoad::mayUseHttp2(const UrlRequest& request, const UrlSessionConfiguration& configuration,
                           const TransferFiles* files)
{
    // libcurl 7.88 has two faults over HTTP/2. If a server answers before it has the whole body and then resets the
    // stream, the status is lost: no uploads. And libcurl reads for all transfers of a connection at once; while the
    // buffer of one is full, it doesn't process what it has read for the others, until the server sends more. The
    // buffer must therefore hold a whole response.
    return !(files && files->upload) &&
           request.maximumResponseSize.value_or(configuration.maximumResponseSize) <= kLargestBuffer;
}

int CurlLoad::status() const
{
    long status = 0;
    if (_easy) curl_easy_getinfo(_easy, CURLINFO_RESPONSE_CODE, &status);
    return static_cast<int>(status);
}

CurlLoad::TimePoint CurlLoad::deadline() const
{
    return std::min(_lastProgress + timeout(), *_began + _configuration.totalTimeout);
}

void CurlLoad::timeOut(TimePoint now)
{
    _error =
        now >= *_began + _configuration.totalTimeout
            ? urlError(kUrlTimedOut, fmt::format("not complete after {:g} s", toSeconds(_configuration.totalTimeout)))
            : urlError(kUrlTimedOut, fmt::format("nothing received for {:g} s", toSeconds(timeout())));
}

void CurlLoad::giveWay()
{
    _error = urlError(kUrlTooLarge, fmt::format("the largest, with {} bytes, of too many in all loads", _body.size()));
}

// ---- sending ----

bool CurlLoad::prepare(CURL* easy)
{
    const auto now = std::chrono::steady_clock::now();
    _lastProgress = now;
    if (!_began) {
        _began = now;
        _marks.start = monotonicSeconds();
    }
    _easy = easy;
    _marks.hop = monotonicSeconds();
    _sent = _anyHeader = _headersEnded = _ledInside = false;
    _headers = {};
    _uploaded = 0;
    curl_slist_free_all(std::exchange(_headerList, nullptr));
    if (!forgetBody() || _error) return false;

    setOptions();
    const bool hasBody = hasUpload() || !_hop.body.empty() || _hop.method == "POST";
    setHeaders(hasBody);
    if (hasBody) {
        curl_easy_setopt(easy, CURLOPT_POST, 1L);
        if (hasUpload()) {
            if (!setUpload()) return false;
        } else {
            curl_easy_setopt(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_hop.body.size()));
            curl_easy_setopt(easy, CURLOPT_POSTFIELDS, _hop.body.empty() ? "" : _hop.body.data());
        }
    }
    if (_hop.method == "HEAD")
        curl_easy_setopt(easy, CURLOPT_NOBODY, 1L);
    else if (_hop.method != (hasBody ? "POST" : "GET"))
        curl_easy_setopt(easy, CURLOPT_CUSTOMREQUEST, _hop.method.c_str());
    return curl_easy_setopt(easy, CURLOPT_URL, _hop.url.string().c_str()) == CURLE_OK;
}

void CurlLoad::setOptions()
{
    const auto set = [this](CURLoption option, auto value) { curl_easy_setopt(_easy, option, value); };
    set(CURLOPT_ERRORBUFFER, _errorText.data());
    set(CURLOPT_NOSIGNAL, 1L);
    // Without it, the end of a load waits for the thread that looks up its host, up to half a minute, and all loads
    // with it.
    set(CURLOPT_QUICK_EXIT, 1L);
    set(CURLOPT_PROTOCOLS_STR, "http,https");
    const bool isHttp2 = _hop.url.scheme() == "https" && mayUseHttp2(_request, _configuration, _files);
    set(CURLOPT_HTTP_VERSION, static_cast<long>(isHttp2 ? CURL_HTTP_VERSION_2TLS : CURL_HTTP_VERSION_1_1));
    const std::size_t buffer = isHttp2 ? std::min(maximumSize() + kMaximumHeaderSize, kLargestBuffer) : kOrdinaryBuffer;
    set(CURLOPT_BUFFERSIZE, static_cast<long>(buffer));
    // Over plain HTTP libcurl would delay every request until the first response.
    set(CURLOPT_PIPEWAIT, _configuration.pipelining && _files && _hop.url.scheme() == "https" ? 1L : 0L);
    set(CURLOPT_FRESH_CONNECT, _fresh ? 1L : 0L);
    set(CURLOPT_TCP_FASTOPEN, _configuration.allowFastOpenAndTickets ? 1L : 0L);
    set(CURLOPT_SSL_SESSIONID_CACHE, _configuration.allowFastOpenAndTickets ? 1L : 0L);
    if (const auto idle = connectionPurgeTimeout(_configuration))
        set(CURLOPT_MAXAGE_CONN, static_cast<long>(toSeconds(*idle)));
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
            return static_cast<CurlLoad*>(self)->received({data, count});
        });
    set(CURLOPT_HEADERDATA, this);
    set(
        CURLOPT_HEADERFUNCTION, +[](char* data, std::size_t, std::size_t count, void* self) {
            return static_cast<CurlLoad*>(self)->receivedHeader({data, count});
        });
    set(CURLOPT_OPENSOCKETDATA, this);
    set(
        CURLOPT_OPENSOCKETFUNCTION, +[](void* self, curlsocktype, curl_sockaddr* address) {
            return static_cast<CurlLoad*>(self)->openSocket(*address);
        });
    set(CURLOPT_PREREQDATA, this);
    set(
        CURLOPT_PREREQFUNCTION,
        +[](void* self, char* address, char*, int, int) { return static_cast<CurlLoad*>(self)->mayConnect(address); });
}

void CurlLoad::setHeaders(bool hasBody)
{
    const auto add = [this](const std::string& line) {
        if (curl_slist* extended = curl_slist_append(_headerList, line.c_str())) _headerList = extended;
    };
    for (const auto& [name, value] : _hop.headers) {
        // libcurl sends an empty field for "Name;".
        const std::string line = value.empty() ? name + ";" : name + ": " + value;
        if (line.find_first_of("\r\n") == std::string::npos) add(line);
    }
    if (!_hop.headers.find("Accept-Encoding")) add(fmt::format("Accept-Encoding: {}", ContentDecoder::kAccepted));
    if (hasBody) {
        // Suppresses libcurl's "Expect: 100-continue" and its default Content-Type of a form.
        add("Expect:");
        if (!_hop.headers.find("Content-Type")) add("Content-Type:");
    }
    curl_easy_setopt(_easy, CURLOPT_HTTPHEADER, _headerList);
}

bool CurlLoad::setUpload()
{
    struct stat status{};
    if (fstat(_files->upload.fd(), &status) != 0) {
        _error = Error::posix(errno, "the upload's file");
        return false;
    }
    _uploadSize = static_cast<std::uint64_t>(status.st_size);
    curl_easy_setopt(_easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(_uploadSize));
    curl_easy_setopt(_easy, CURLOPT_READDATA, this);
    curl_easy_setopt(
        _easy, CURLOPT_READFUNCTION, +[](char* buffer, std::size_t size, std::size_t count, void* self) {
            return static_cast<CurlLoad*>(self)->readUpload(buffer, size * count);
        });
    // libcurl rewinds if a reused connection turns out to be closed.
    curl_easy_setopt(_easy, CURLOPT_SEEKDATA, this);
    curl_easy_setopt(
        _easy, CURLOPT_SEEKFUNCTION, +[](void* self, curl_off_t offset, int origin) {
            if (origin != SEEK_SET || offset < 0) return CURL_SEEKFUNC_FAIL;
            static_cast<CurlLoad*>(self)->_uploaded = static_cast<std::uint64_t>(offset);
            return CURL_SEEKFUNC_OK;
        });
    return true;
}

std::size_t CurlLoad::readUpload(char* buffer, std::size_t size)
{
    _lastProgress = std::chrono::steady_clock::now();
    ssize_t count = -1;
    do count = pread(_files->upload.fd(), buffer, size, static_cast<off_t>(_uploaded));
    while (count < 0 && errno == EINTR);
    // A file that was truncated meanwhile must not be sent as complete.
    if (count < 0 || (count == 0 && size > 0 && _uploaded < _uploadSize)) {
        _error = Error::posix(count < 0 ? errno : EIO, "the upload's file");
        return CURL_READFUNC_ABORT;
    }
    _uploaded += static_cast<std::uint64_t>(count);
    if (_files->progress && count > 0) _files->progress(_uploaded, _uploadSize);
    return static_cast<std::size_t>(count);
}

/// Returns false if a public host led to an address that isn't public, by a redirect or a URL in a response.
bool CurlLoad::mayReach(const char* address)
{
    const bool forbidden = _hop.source && _hop.source->isPublic && !isPublicAddress(address);
    _ledInside = _ledInside || forbidden;
    return !forbidden;
}

/// Refuses a forbidden address before any packet is sent to it. libcurl then tries the host's next address.
curl_socket_t CurlLoad::openSocket(const curl_sockaddr& address)
{
    std::array<char, NI_MAXHOST> text{};
    getnameinfo(&address.addr, static_cast<socklen_t>(address.addrlen), text.data(), text.size(), nullptr, 0,
                NI_NUMERICHOST);
    return mayReach(text.data()) ? socket(address.family, address.socktype | SOCK_CLOEXEC, address.protocol)
                                 : CURL_SOCKET_BAD;
}

/// Runs before the request is sent, also on a connection that an earlier load opened.
int CurlLoad::mayConnect(const char* address)
{
    _sent = true;
    _publicPeer = isPublicAddress(address);
    return mayReach(address) ? CURL_PREREQFUNC_OK : CURL_PREREQFUNC_ABORT;
}

// ---- receiving ----

std::size_t CurlLoad::receivedHeader(std::string_view line)
{
    _lastProgress = std::chrono::steady_clock::now();
    _anyHeader = true;
    _headerSize += line.size();
    if (_headerSize > kMaximumHeaderSize) {
        _error = urlError(kUrlTooLarge, fmt::format("more than {} bytes of header fields", kMaximumHeaderSize));
        return 0;
    }
    if (line.starts_with("HTTP/")) {
        _headers = {}; // drops those of an interim response
        _headersEnded = false;
        return line.size();
    }
    if (_headersEnded) return line.size();
    if (line == "\r\n" || line == "\n") {
        _headersEnded = true;
        _decoder = ContentDecoder(_headers.list("Content-Encoding"));
        return line.size();
    }
    const std::size_t colon = line.find(':');
    const auto isBlank = [](char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; };
    // A line without a name continues another field or is none.
    if (colon == 0 || colon == std::string_view::npos || std::ranges::any_of(line.substr(0, colon), isBlank))
        return line.size();
    std::string_view text = line.substr(colon + 1);
    while (!text.empty() && isBlank(text.front())) text.remove_prefix(1);
    while (!text.empty() && isBlank(text.back())) text.remove_suffix(1);
    std::string value(text);
    std::ranges::replace(value, '\r', ' '); // RFC 9110, 5.5
    _headers.add(std::string(line.substr(0, colon)), std::move(value));
    return line.size();
}

std::size_t CurlLoad::received(std::string_view bytes)
{
    _lastProgress = std::chrono::steady_clock::now();
    _wireSize += bytes.size();
    if (_decoder.feed(bytes, [this](std::string_view decoded) { return keep(decoded); }) && _wireSize <= maximumSize())
        return bytes.size();
    if (!_error && _wireSize > maximumSize())
        _error = urlError(kUrlTooLarge, fmt::format("more than {} bytes", maximumSize()));
    if (!_error) _error = urlError(kUrlBadResponse, "the body doesn't fit its content coding");
    return 0;
}

bool CurlLoad::keep(std::string_view bytes)
{
    if (_bodySize + bytes.size() > maximumSize()) {
        _error = urlError(kUrlTooLarge, fmt::format("more than {} bytes", maximumSize()));
        return false;
    }
    if (_files) {
        if (!store(bytes)) return false;
    } else {
        if (_body.empty() && !_decoder.decodes()) {
            curl_off_t length = -1;
            curl_easy_getinfo(_easy, CURLINFO_CONTENT_LENGTH_DOWNLOAD_T, &length);
            const auto expected = static_cast<std::size_t>(std::max<curl_off_t>(length, 0));
            _body.reserve(std::min(expected, maximumSize()));
        }
        _body.append(bytes);
        _inMemory += bytes.size();
    }
    _bodySize += bytes.size();
    return true;
}

bool CurlLoad::store(std::string_view bytes)
{
    if (!_files->download) return true;
    for (std::size_t written = 0; written < bytes.size();) {
        const ssize_t count = pwrite(_files->download.fd(), bytes.data() + written, bytes.size() - written,
                                     static_cast<off_t>(_bodySize + written));
        if (count < 0 && errno != EINTR) {
            _error = Error::posix(errno, "the download's file");
            return false;
        }
        if (count > 0) written += static_cast<std::size_t>(count);
    }
    return true;
}

/// Drops the body of an earlier hop. Returns false if the file can't be truncated.
bool CurlLoad::forgetBody()
{
    _inMemory -= _body.size();
    _body.clear();
    _wireSize = 0;
    if (std::exchange(_bodySize, 0) == 0 || !_files || !_files->download) return true;
    if (ftruncate(_files->download.fd(), 0) != 0) _error = Error::posix(errno, "the download's file");
    return !_error;
}

// ---- the end of a hop ----

UrlResponse CurlLoad::response() const
{
    return {.url = _hop.url,
            .isHttp = true,
            .statusCode = status(),
            .headers = _headers,
            .publicPeer = _publicPeer || (_hop.source && _hop.source->isPublic)};
}

/// Returns true if the request was sent on a reused connection and no byte came back: the server had closed it, or
/// closed it at that moment. (libcurl itself retries on other reused connections, which may be dead too, and gives up
/// after five.)
bool CurlLoad::wasLostUnanswered(CURLcode code) const
{
    if (_fresh || _anyHeader || _error) return false;
    long made = 0;
    curl_easy_getinfo(_easy, CURLINFO_NUM_CONNECTS, &made);
    return made == 0 && (code == CURLE_SEND_ERROR || code == CURLE_RECV_ERROR || code == CURLE_GOT_NOTHING ||
                         code == CURLE_HTTP2 || code == CURLE_HTTP2_STREAM);
}

bool CurlLoad::goesOn(CURLcode code)
{
    if (wasLostUnanswered(code)) {
        _fresh = true;
        return true;
    }
    if (_error || !isFinal() || (code != CURLE_OK && !hasUpload())) return false;
    const UrlSource source{.secure = _hop.url.scheme() == "https" || (_hop.source && _hop.source->secure),
                           .isPublic = _publicPeer || (_hop.source && _hop.source->isPublic)};
    auto next = redirected(_hop, hasUpload() || !_hop.body.empty(), response(), source);
    if (!next) return false;
    if (!*next) {
        _error = std::move(next->error());
        return false;
    }
    if (_redirects == _configuration.maximumRedirects) {
        _error = urlError(kUrlTooManyRedirects, fmt::format("more than {} redirects", _redirects));
        return false;
    }
    ++_redirects;
    _uploads = _uploads && (*next)->method == _hop.method;
    _hop = std::move(**next);
    _fresh = false;
    _marks.redirectEnd = monotonicSeconds();
    return true;
}

std::optional<Error> CurlLoad::errorOf(CURLcode code) const
{
    // A final status completes an upload, even if the connection or the rest of the body fails after it.
    if (hasUpload() && !_files->download && isFinal() && (!_error || _error->code == kUrlTimedOut)) return std::nullopt;
    if (_error) return _error;
    if (_ledInside && (code == CURLE_COULDNT_CONNECT || code == CURLE_ABORTED_BY_CALLBACK))
        return urlError(kUrlForbiddenRedirect, "led to an address that isn't public");
    // libcurl uses this code also for a response that isn't HTTP.
    if (code == CURLE_UNSUPPORTED_PROTOCOL && _sent)
        return urlError(kUrlBadResponse, fmt::format("the response isn't HTTP: {}", _errorText.data()));
    if (code != CURLE_OK) return urlErrorFromCurl(code, _errorText.data());
    if (!isFinal()) return urlError(kUrlBadResponse, "the response has no complete head with a final status");
    if (!_decoder.finished()) return urlError(kUrlBadResponse, "the body ends before its content coding does");
    return std::nullopt;
}

CurlLoad::Outcome CurlLoad::finish(CURLcode code)
{
    Outcome outcome;
    outcome.error = errorOf(code);
    if (_easy) {
        if (status() > 0) outcome.response = response();
        outcome.timing = timingDataOf(_easy, _marks);
    }
    if (!outcome.error) {
        _inMemory -= _body.size();
        outcome.data = Bytes(std::exchange(_body, {}));
    }
    _easy = nullptr;
    return outcome;
}

} // namespace platform
