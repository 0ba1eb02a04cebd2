#pragma once

#include <cstdlib>
#include <string>

#include <curl/curl.h>
#include <simdjson.h>

namespace tavrin::bench {

/// What a search is compared with: libcurl and simdjson on one thread, with a warm connection. One thread.
class PlainClient {
public:
    /// `certificate` is a file of authorities to trust; empty: the system's.
    explicit PlainClient(const std::string& certificate = {}) : _curl(curl_easy_init())
    {
        if (!certificate.empty()) curl_easy_setopt(_curl, CURLOPT_CAINFO, certificate.c_str());
        curl_easy_setopt(_curl, CURLOPT_WRITEDATA, &_body);
        curl_easy_setopt(
            _curl, CURLOPT_WRITEFUNCTION, +[](char* data, std::size_t size, std::size_t count, void* body) {
                static_cast<std::string*>(body)->append(data, size * count);
                return size * count;
            });
    }
    ~PlainClient() { curl_easy_cleanup(_curl); }
    PlainClient(const PlainClient&) = delete;
    PlainClient& operator=(const PlainClient&) = delete;

    void request(const std::string& url)
    {
        _body.clear();
        curl_easy_setopt(_curl, CURLOPT_URL, url.c_str());
        if (curl_easy_perform(_curl) != CURLE_OK) std::abort();
        simdjson::dom::element document;
        if (_parser.parse(_body).get(document) != simdjson::SUCCESS || !document.is_array()) std::abort();
    }

private:
    CURL* _curl;
    std::string _body;
    simdjson::dom::parser _parser;
};

} // namespace tavrin::bench
