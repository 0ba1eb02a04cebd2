#pragma once

#include <array>
#include <chrono>
#include <optional>
#include <string>
#include <string_view>

#include <curl/curl.h>

#include "platform/net/ContentCoding.h"
#include "platform/net/CurlSupport.h"
#include "platform/net/UrlSession.h"

namespace platform {

/// One load: a sequence of libcurl transfers, one for each hop.
///
///     prepare ──► [transfer ──► goesOn]… ──► finish
///
/// Another hop follows a redirect, and a request that was lost on a reused connection. Loader's queue only.
class CurlLoad {
public:
    using TimePoint = std::chrono::steady_clock::time_point;

    /// `request`, `configuration` and `files` (null for a data task) must outlive the load. `inMemory` counts the bytes
    /// of bodies that unfinished loads have in memory.
    CurlLoad(const UrlRequest& request, const UrlSessionConfiguration& configuration, const TransferFiles* files,
             std::size_t& inMemory);
    ~CurlLoad();
    CurlLoad(const CurlLoad&) = delete;
    CurlLoad& operator=(const CurlLoad&) = delete;

    /// Returns whether https hops of the load may use HTTP/2. Loads that may, and loads that may not, need multi
    /// handles of their own: once a host has a connection over HTTP/2, libcurl 7.88 also shares those over HTTP/1.1
    /// that are busy, and gives one load the response to another.
    [[nodiscard]] static bool mayUseHttp2(const UrlRequest& request, const UrlSessionConfiguration& configuration,
                                          const TransferFiles* files);

    /// Sets up the next hop on a new or reset handle. Returns false if it can't be sent; `finish` has the error.
    [[nodiscard]] bool prepare(CURL* easy);
    /// Call this after a transfer has ended with `code`. Returns true if a redirect must be followed: then call
    /// `prepare` again, with another handle.
    [[nodiscard]] bool goesOn(CURLcode code);
    /// Sets the time-out error. Call this at `deadline`.
    void timeOut(TimePoint now);
    /// Bytes of the body in memory.
    [[nodiscard]] std::size_t inMemory() const { return _body.size(); }
    /// Fails the load because all loads together have too many bytes in memory.
    void giveWay();

    struct Outcome {
        std::optional<Bytes> data;
        std::optional<UrlResponse> response;
        std::optional<Error> error;
        Value timing;
    };
    /// Returns the result of the load. Call it once, before the handle of the last hop is reset.
    [[nodiscard]] Outcome finish(CURLcode code);

    [[nodiscard]] CURL* easy() const { return _easy; }
    /// Returns when the load times out. Each received byte, and each sent byte of a file, moves the deadline.
    [[nodiscard]] TimePoint deadline() const;

private:
    [[nodiscard]] bool hasUpload() const { return _files && _files->upload && _uploads; }
    [[nodiscard]] Duration timeout() const { return _request.timeout.value_or(_configuration.requestTimeout); }
    [[nodiscard]] std::size_t maximumSize() const;
    [[nodiscard]] int status() const;
    [[nodiscard]] bool isFinal() const { return _headersEnded && status() >= 200; }
    [[nodiscard]] bool wasLostUnanswered(CURLcode code) const;
    [[nodiscard]] UrlResponse response() const;
    [[nodiscard]] std::optional<Error> errorOf(CURLcode code) const;

    void setOptions();
    void setHeaders(bool hasBody);
    [[nodiscard]] bool setUpload();
    bool forgetBody();
    std::size_t received(std::string_view bytes);
    bool keep(std::string_view bytes);
    bool store(std::string_view bytes);
    std::size_t receivedHeader(std::string_view line);
    std::size_t readUpload(char* buffer, std::size_t size);
    [[nodiscard]] bool mayReach(const char* address);
    [[nodiscard]] curl_socket_t openSocket(const curl_sockaddr& address);
    [[nodiscard]] int mayConnect(const char* address);

    const UrlRequest& _request;
    const UrlSessionConfiguration& _configuration;
    const TransferFiles* const _files;
    std::size_t& _inMemory;

    // The load.
    std::optional<TimePoint> _began;
    TimePoint _lastProgress;
    std::size_t _headerSize = 0;
    unsigned _redirects = 0;
    LoadMarks _marks;
    std::optional<Error> _error; // overrides libcurl's

    // The hop.
    CURL* _easy = nullptr;
    UrlRequest _hop;
    bool _uploads = true; // false after a redirect to a GET
    bool _fresh = false;  // requires a new connection, because a reused one was dead
    curl_slist* _headerList = nullptr;
    bool _sent = false;
    bool _anyHeader = false;
    bool _headersEnded = false; // later header lines are trailers
    bool _publicPeer = false;
    bool _ledInside = false; // an address was refused
    HttpHeaders _headers;
    ContentDecoder _decoder;
    std::string _body;
    std::size_t _bodySize = 0; // decoded bytes, in memory or in the file
    std::size_t _wireSize = 0;
    std::uint64_t _uploaded = 0;
    std::uint64_t _uploadSize = 0;
    std::array<char, CURL_ERROR_SIZE> _errorText{};
};

} // namespace platform
