#include "platform/CurlTask.h"

#include <algorithm>
#include <cerrno>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

#include <fmt/format.h>
#include <openssl/ssl.h>

namespace platform {

namespace {

/// Of one load, over all its hops. libcurl refuses a single line beyond 100 KiB.
constexpr std::size_t kMaximumHeaderSize = 256u << 10;

/// An ordinary answer comes in one piece, where libcurl's own size would make four of it.
constexpr long kReceiveBuffer = 64L << 10;

} // namespace

std::size_t CurlTask::received(std::string_view bytes)
{
    progressed();
    if (_bodySize + bytes.size() > _configuration.maximumResponseSize) {
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
            _body.reserve(std::min(expected, _configuration.maximumResponseSize));
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
        forgetBody();
        return line.size();
    }
    const std::size_t colon = line.find(':');
    if (colon == std::string_view::npos) return line.size();
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

/// A public host must not lead us, by a redirect, to an address of the inner network.
int CurlTask::mayConnect(const char* address)
{
    _sentHop = hop();
    const bool isPublic = isPublicAddress(address);
    if (!_firstHopPublic) _firstHopPublic = isPublic;
    _forbiddenHop = *_firstHopPublic && !isPublic;
    return _forbiddenHop ? CURL_PREREQFUNC_ABORT : CURL_PREREQFUNC_OK;
}

bool CurlTask::configureUpload()
{
    struct stat status {};
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
    set(CURLOPT_BUFFERSIZE, kReceiveBuffer);
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

Queue::Task CurlTask::completion(CURLcode code, bool cancelled)
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
                                           : fmt::format("more than {} bytes", _configuration.maximumResponseSize));
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
        char* url = nullptr;
        curl_easy_getinfo(_easy, CURLINFO_RESPONSE_CODE, &status);
        curl_easy_getinfo(_easy, CURLINFO_EFFECTIVE_URL, &url);
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
    return [self = shared_from_this(), data = std::move(data), response = std::move(response),
            error = std::move(error)]() mutable {
        // Moved out first: the completion may be what keeps the task's owner alive.
        auto completion = std::exchange(self->_completion, {});
        completion(std::move(data), std::move(response), std::move(error));
    };
}

} // namespace platform
