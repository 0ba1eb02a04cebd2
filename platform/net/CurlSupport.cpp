#include "platform/net/CurlSupport.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <chrono>
#include <cstring>
#include <ifaddrs.h>
#include <memory>
#include <netinet/in.h>

#include "platform/net/UrlSession.h"
#include "platform/values/Dictionary.h"

namespace platform {

Error urlError(std::int64_t code, std::string reason)
{
    return Error::withReason(std::string(kUrlErrorDomain), code, std::move(reason));
}

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

namespace {

/// Where an IPv6 address holds the IPv4 address that it stands for: mapped, compatible, behind NAT64 (RFC 6052) or
/// 6to4 (RFC 3056); null for others.
const unsigned char* embeddedIPv4(const in6_addr& v6)
{
    constexpr unsigned char kNat64[12]{0, 0x64, 0xff, 0x9b};
    if (IN6_IS_ADDR_V4MAPPED(&v6) || IN6_IS_ADDR_V4COMPAT(&v6) || std::memcmp(v6.s6_addr, kNat64, sizeof kNat64) == 0)
        return v6.s6_addr + 12;
    return v6.s6_addr[0] == 0x20 && v6.s6_addr[1] == 0x02 ? v6.s6_addr + 2 : nullptr;
}

} // namespace

bool isPublicAddress(const std::string& address)
{
    in_addr v4{};
    in6_addr v6{};
    if (inet_pton(AF_INET6, address.c_str(), &v6) == 1) {
        const unsigned char* embedded = embeddedIPv4(v6);
        if (!embedded) {
            const bool uniqueLocal = (v6.s6_addr[0] & 0xfe) == 0xfc;
            return !(IN6_IS_ADDR_LOOPBACK(&v6) || IN6_IS_ADDR_UNSPECIFIED(&v6) || IN6_IS_ADDR_LINKLOCAL(&v6) ||
                     uniqueLocal);
        }
        std::memcpy(&v4, embedded, sizeof v4);
    } else if (inet_pton(AF_INET, address.c_str(), &v4) != 1) {
        return false;
    }
    const std::uint32_t a = ntohl(v4.s_addr);
    const auto within = [a](std::uint32_t network, int bits) { return (a ^ network) >> (32 - bits) == 0; };
    return !(within(0x7f000000, 8) || within(0x0a000000, 8) || within(0xac100000, 12) || within(0xc0a80000, 16) ||
             within(0xa9fe0000, 16) || within(0x64400000, 10) || within(0x00000000, 8));
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

/// The name of the interface that has this address now.
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

/// The same, as of 10 s ago at most: listing a device's interfaces takes longer than parsing an answer.
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

TransferMarks transferMarks(CURL* easy)
{
    long connections = 0;
    curl_easy_getinfo(easy, CURLINFO_NUM_CONNECTS, &connections);
    return {.lookup = seconds(easy, CURLINFO_NAMELOOKUP_TIME_T),
            .connected = seconds(easy, CURLINFO_CONNECT_TIME_T),
            .secured = seconds(easy, CURLINFO_APPCONNECT_TIME_T),
            .ready = seconds(easy, CURLINFO_PRETRANSFER_TIME_T),
            .firstByte = seconds(easy, CURLINFO_STARTTRANSFER_TIME_T),
            .connections = connections};
}

Value timingDataOf(CURL* easy, double start, const TransferMarks& earlierHops)
{
    const auto text = [&](CURLINFO info) {
        char* value = nullptr;
        curl_easy_getinfo(easy, info, &value);
        return std::string(value ? value : "");
    };
    const TransferMarks marks = transferMarks(easy);
    const double redirects = seconds(easy, CURLINFO_REDIRECT_TIME_T);
    const double total = seconds(easy, CURLINFO_TOTAL_TIME_T);
    long port = 0;
    curl_easy_getinfo(easy, CURLINFO_PRIMARY_PORT, &port);
    const bool reused = marks.connections == earlierHops.connections && marks.ready > earlierHops.ready;

    // 0 is a stage that didn't happen. One that wasn't needed is as old as the one before.
    const auto at = [&](double TransferMarks::* mark, bool happened = true) {
        const double offset = marks.*mark - earlierHops.*mark;
        return happened && offset > 0 ? start + redirects + offset : 0.0;
    };
    const double connected = at(&TransferMarks::connected, !reused);
    const double secured = at(&TransferMarks::secured, !reused);
    Dictionary timing{{"_kCFNTimingDataFetchStart", start},
                      {"_kCFNTimingDataRedirectStart", redirects > 0 ? start : 0.0},
                      {"_kCFNTimingDataRedirectEnd", redirects > 0 ? start + redirects : 0.0},
                      {"_kCFNTimingDataDomainLookupStart", reused ? 0.0 : start + redirects},
                      {"_kCFNTimingDataDomainLookupEnd", at(&TransferMarks::lookup, !reused)},
                      {"_kCFNTimingDataConnectStart", at(&TransferMarks::lookup, !reused)},
                      {"_kCFNTimingDataConnectEnd", std::max(connected, secured)},
                      {"_kCFNTimingDataSecureConnectionStart", secured > 0 ? connected : 0.0},
                      {"_kCFNTimingDataRequestStart", at(&TransferMarks::ready)},
                      {"_kCFNTimingDataResponseStart", at(&TransferMarks::firstByte)},
                      {"_kCFNTimingDataResponseEnd", start + total},
                      {"_kCFNTimingDataConnectionReused", reused}};
    if (std::string name = interfaceOf(text(CURLINFO_LOCAL_IP)); !name.empty())
        timing.set("_kCFNTimingDataConnectionInterfaceIdentifier", std::move(name));
    if (std::string address = socketAddress(text(CURLINFO_PRIMARY_IP), port); !address.empty())
        timing.set("_kCFNTimingDataConnectionPeerAddress", Bytes(std::move(address)));
    return timing;
}

} // namespace platform
