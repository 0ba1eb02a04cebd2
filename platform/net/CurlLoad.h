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

/// One load as libcurl sees it: a transfer for each hop, one after the other.
///
///     prepare ──► [transfer ──► goesOn]… ──► finish
///
/// A hop that ends in a redirect, or that was lost on an old connection, is followed by another. Loader's thread only.
class CurlLoad {
public:
    using TimePoint = std::chrono::steady_clock::time_point;

    /// `request`, `configuration` and `files` (null for none) outlive the load. `inMemory` counts the bytes of bodies
    /// that unfinished loads hold in memory.
    CurlLoad(const UrlRequest& request, const UrlSessionConfiguration& configuration, const TransferFiles* files,
             std::size_t& inMemory);
    ~CurlLoad();
    CurlLoad(const CurlLoad&) = delete;
    CurlLoad& operator=(const CurlLoad&) = delete;

    /// Sets the next hop up on a handle that has no options yet. False if it can't be sent; `finish` says why.
    [[nodiscard]] bool prepare(CURL* easy);
    /// Whether another hop is due now that libcurl has ended one with `code`: then reset the handle and `prepare` it.
    [[nodiscard]] bool goesOn(CURLcode code);
    /// Gives the load up for having taken too long.
    void timeOut(TimePoint now);

    struct Outcome {
        std::optional<Bytes> data;
        std::optional<UrlResponse> response;
        std::optional<Error> error;
        Value timing;
    };
    /// What the load came to. Once; before the handle of the last hop is reset.
    [[nodiscard]] Outcome finish(CURLcode code);

    [[nodiscard]] CURL* easy() const { return _easy; }
    /// When it times out unless something is received, or sent of a file, before.
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
    int mayConnect(const char* address);

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
    std::optional<Error> _error; // found by ourselves, in place of libcurl's

    // The hop.
    CURL* _easy = nullptr;
    UrlRequest _hop;
    bool _uploads = true; // a redirect may turn it into a GET
    bool _fresh = false;  // on a new connection, because an old one was dead
    curl_slist* _headerList = nullptr;
    bool _sent = false;
    bool _anyHeader = false;
    bool _headersEnded = false; // what comes behind the body is no header field
    bool _publicPeer = false;
    HttpHeaders _headers;
    ContentDecoder _decoder;
    std::string _body;
    std::size_t _bodySize = 0; // decoded, whether it is in memory or not
    std::size_t _wireSize = 0;
    std::uint64_t _uploaded = 0;
    std::uint64_t _uploadSize = 0;
    std::array<char, CURL_ERROR_SIZE> _errorText{};
};

} // namespace platform
