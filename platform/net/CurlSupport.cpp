#include "platform/net/CurlSupport.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <chrono>
#include <cstring>
#include <ifaddrs.h>
#include <memory>
#include <netinet/in.h>

#include "platform/net/NetworkStatus.h"
#include "platform/net/UrlSession.h"
#include "platform/values/Dictionary.h"

namespace platform {

Error urlErrorFromCurl(CURLcode code, const char* detail)
{
    const auto mapped = [code]() -> std::int64_t {
        switch (code) {
        case CURLE_URL_MALFORMAT: return kUrlBadUrl;
        case CURLE_UNSUPPORTED_PROTOCOL: return kUrlUnsupported;
        case CURLE_COULDNT_RESOLVE_HOST:
        case CURLE_COULDNT_RESOLVE_PROXY: return kUrlCannotFindHost;
        case CURLE_COULDNT_CONNECT: return kUrlCannotConnect;
        case CURLE_OPERATION_TIMEDOUT: return kUrlTimedOut;
        case CURLE_TOO_MANY_REDIRECTS: return kUrlTooManyRedirects;
        case CURLE_SSL_CONNECT_ERROR:
        case CURLE_PEER_FAILED_VERIFICATION:
        case CURLE_SSL_CERTPROBLEM:
        case CURLE_SSL_CIPHER:
        case CURLE_SSL_CACERT_BADFILE:
        case CURLE_SSL_ISSUER_ERROR: return kUrlTlsFailed;
        case CURLE_FILESIZE_EXCEEDED: return kUrlTooLarge;
        case CURLE_WEIRD_SERVER_REPLY:
        case CURLE_BAD_CONTENT_ENCODING:
        case CURLE_HTTP2:
        case CURLE_HTTP2_STREAM: return kUrlBadResponse;
        default: return kUrlConnectionLost;
        }
    };
    std::string reason = curl_easy_strerror(code);
    if (detail && *detail) reason += std::string(": ") + detail;
    return urlError(mapped(), std::move(reason));
}

std::optional<Duration> connectionPurgeTimeout(const UrlSessionConfiguration& configuration)
{
    if (!configuration.meteredPurgeTimeout || !configuration.network) return std::nullopt;
    const auto state = configuration.network->current();
    return state && state->metered ? configuration.meteredPurgeTimeout : std::nullopt;
}

std::string socketAddress(const std::string& ip, long port)
{
    const auto put = [&](std::string& address, std::size_t length, char family) {
        address.assign(length, '\0');
        address[0] = static_cast<char>(length);
        address[1] = family;
        address[2] = static_cast<char>(port >> 8);
        address[3] = static_cast<char>(port & 0xff);
    };
    std::string address;
    in_addr v4{};
    in6_addr v6{};
    if (inet_pton(AF_INET, ip.c_str(), &v4) == 1) {
        put(address, 16, 2);
        std::memcpy(address.data() + 4, &v4, sizeof v4);
    } else if (inet_pton(AF_INET6, ip.c_str(), &v6) == 1) {
        put(address, 28, 30);
        std::memcpy(address.data() + 8, &v6, sizeof v6);
    }
    return address;
}

double monotonicSeconds()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

namespace {

double seconds(CURL* easy, CURLINFO info)
{
    curl_off_t microseconds = 0;
    curl_easy_getinfo(easy, info, &microseconds);
    return static_cast<double>(microseconds) / 1e6;
}

/// Returns the name of the network interface with this address; empty if there is none.
std::string readInterfaceOf(const std::string& localIp)
{
    ifaddrs* list = nullptr;
    if (getifaddrs(&list) != 0) return {};
    const std::unique_ptr<ifaddrs, decltype(&freeifaddrs)> owner(list, freeifaddrs);
    for (const ifaddrs* entry = list; entry; entry = entry->ifa_next) {
        if (!entry->ifa_addr) continue;
        std::array<char, INET6_ADDRSTRLEN> text{};
        const int family = entry->ifa_addr->sa_family;
        const void* address = nullptr;
        if (family == AF_INET)
            address = &reinterpret_cast<const sockaddr_in*>(entry->ifa_addr)->sin_addr;
        else if (family == AF_INET6)
            address = &reinterpret_cast<const sockaddr_in6*>(entry->ifa_addr)->sin6_addr;
        if (address && inet_ntop(family, address, text.data(), text.size()) && localIp == text.data())
            return entry->ifa_name;
    }
    return {};
}

/// Likewise, cached for 10 s: listing the interfaces takes longer than parsing a response.
std::string interfaceOf(const std::string& localIp)
{
    constexpr double kTrustedFor = 10;
    thread_local std::string ip, name;
    thread_local double read = 0;
    if (const double now = monotonicSeconds(); localIp != ip || now - read > kTrustedFor) {
        name = readInterfaceOf(localIp);
        ip = localIp;
        read = now;
    }
    return name;
}

} // namespace

Value timingDataOf(CURL* easy, const LoadMarks& marks)
{
    const auto text = [&](CURLINFO info) {
        char* value = nullptr;
        curl_easy_getinfo(easy, info, &value);
        return std::string(value ? value : "");
    };
    // 0 means that the stage didn't happen.
    const auto at = [&](CURLINFO info, bool happened = true) {
        const double offset = seconds(easy, info);
        return happened && offset > 0 ? marks.hop + offset : 0.0;
    };
    long port = 0;
    long connectionsMade = 0;
    curl_easy_getinfo(easy, CURLINFO_PRIMARY_PORT, &port);
    curl_easy_getinfo(easy, CURLINFO_NUM_CONNECTS, &connectionsMade);
    const double requested = at(CURLINFO_PRETRANSFER_TIME_T);
    const bool reused = connectionsMade == 0 && requested > 0;
    const double lookedUp = at(CURLINFO_NAMELOOKUP_TIME_T, !reused);
    const double connected = at(CURLINFO_CONNECT_TIME_T, !reused);
    const double secured = at(CURLINFO_APPCONNECT_TIME_T, !reused);
    Dictionary timing{{"_kCFNTimingDataFetchStart", marks.start},
                      {"_kCFNTimingDataRedirectStart", marks.redirectEnd > 0 ? marks.start : 0.0},
                      {"_kCFNTimingDataRedirectEnd", marks.redirectEnd},
                      {"_kCFNTimingDataDomainLookupStart", reused ? 0.0 : marks.hop},
                      {"_kCFNTimingDataDomainLookupEnd", lookedUp},
                      {"_kCFNTimingDataConnectStart", lookedUp},
                      {"_kCFNTimingDataConnectEnd", std::max(connected, secured)},
                      {"_kCFNTimingDataSecureConnectionStart", secured > 0 ? connected : 0.0},
                      {"_kCFNTimingDataRequestStart", requested},
                      {"_kCFNTimingDataResponseStart", at(CURLINFO_STARTTRANSFER_TIME_T)},
                      {"_kCFNTimingDataResponseEnd", marks.hop + seconds(easy, CURLINFO_TOTAL_TIME_T)},
                      {"_kCFNTimingDataConnectionReused", reused}};
    if (std::string name = interfaceOf(text(CURLINFO_LOCAL_IP)); !name.empty())
        timing.set("_kCFNTimingDataConnectionInterfaceIdentifier", std::move(name));
    if (std::string address = socketAddress(text(CURLINFO_PRIMARY_IP), port); !address.empty())
        timing.set("_kCFNTimingDataConnectionPeerAddress", Bytes(std::move(address)));
    return timing;
}

} // namespace platform
