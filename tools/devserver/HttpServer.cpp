#include "tools/devserver/HttpServer.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <fstream>
#include <iterator>
#include <netdb.h>
#include <stdexcept>
#include <sys/socket.h>
#include <system_error>

#include <microhttpd.h>

#include "platform/base/FileHandle.h"
#include "tools/devserver/Compression.h"

namespace devserver {
namespace {

constexpr int kBacklog = 128;
constexpr unsigned kIdleSeconds = 60;
/// Bytes for the header fields of a request, and for the buffers to read and write.
constexpr std::size_t kConnectionMemory = 64u << 10;
constexpr std::size_t kPiece = 1u << 16;
constexpr std::size_t kPackedFrom = 256; // smaller bodies hardly shrink

/// A request that is being received.
struct Exchange {
    Request request;
    bool begun = false;
    bool tooLarge = false;
};

std::string contentsOf(const std::filesystem::path& path)
{
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// Returns the address and the port of a socket address.
std::pair<std::string, int> endOf(const sockaddr& address)
{
    std::array<char, INET6_ADDRSTRLEN> text{};
    if (address.sa_family == AF_INET) {
        const auto& v4 = reinterpret_cast<const sockaddr_in&>(address);
        inet_ntop(AF_INET, &v4.sin_addr, text.data(), text.size());
        return {text.data(), ntohs(v4.sin_port)};
    }
    const auto& v6 = reinterpret_cast<const sockaddr_in6&>(address);
    inet_ntop(AF_INET6, &v6.sin6_addr, text.data(), text.size());
    return {text.data(), ntohs(v6.sin6_port)};
}

std::string headerOf(const Headers& headers, std::string_view name)
{
    const std::string* value = findHeader(headers, name);
    return value ? *value : "";
}

/// A padded, cut or endless body, which the library reads piece by piece.
struct Stream {
    Answer answer;
    std::size_t length = 0; // as announced; endless bodies have none
    std::size_t end = 0;
    std::size_t sent = 0; // of the current text of an endless body

    /// Writes the bytes at `offset`, `size` at most, and returns their number; MHD_CONTENT_READER_END_WITH_ERROR ends
    /// the connection.
    ssize_t read(std::size_t offset, char* buffer, std::size_t size)
    {
        if (answer.more) return readMore(buffer, size);
        const std::string& body = answer.body;
        if (offset >= end) return MHD_CONTENT_READER_END_WITH_ERROR; // less than was announced
        const bool inBody = offset < body.size();
        const std::size_t count = std::min(size, (inBody ? std::min(body.size(), end) : end) - offset);
        if (inBody)
            std::memcpy(buffer, body.data() + offset, count);
        else
            std::memset(buffer, ' ', count);
        return static_cast<ssize_t>(count);
    }

    ssize_t readMore(char* buffer, std::size_t size)
    {
        if (sent == answer.body.size()) {
            auto next = answer.more();
            if (!next) return MHD_CONTENT_READER_END_WITH_ERROR;
            answer.body = std::move(*next);
            sent = 0;
        }
        const std::size_t count = answer.body.copy(buffer, size, sent);
        sent += count;
        return static_cast<ssize_t>(count);
    }
};

using Response = std::unique_ptr<MHD_Response, decltype(&MHD_destroy_response)>;

Response streamed(Answer answer)
{
    auto stream = std::make_unique<Stream>();
    stream->length = std::max<std::size_t>({answer.body.size(), answer.paddedTo, 2});
    stream->end = answer.cut ? stream->length / 2 : stream->length;
    const std::uint64_t size = answer.more ? MHD_SIZE_UNKNOWN : stream->length;
    stream->answer = std::move(answer);
    return {MHD_create_response_from_callback(
                size, kPiece,
                [](void* self, std::uint64_t offset, char* buffer, std::size_t room) {
                    return static_cast<Stream*>(self)->read(offset, buffer, room);
                },
                stream.release(), [](void* self) { delete static_cast<Stream*>(self); }),
            MHD_destroy_response};
}

/// Converts an answer for the library. Compresses complete JSON bodies for clients that accept gzip.
Response responseOf(Answer answer, const Request& request)
{
    const Headers headers = answer.headers;
    const std::string type = answer.contentType;
    const bool hasBody = !answer.body.empty() || answer.more || answer.paddedTo > 0 || answer.cut;
    bool packed = false, packable = false;
    Response response(nullptr, MHD_destroy_response);
    if (answer.more || answer.cut || answer.paddedTo > answer.body.size()) {
        response = streamed(std::move(answer));
    } else {
        packable =
            answer.body.size() >= kPackedFrom && type == "application/json" && !findHeader(headers, "Content-Encoding");
        packed = packable && headerOf(request.headers, "Accept-Encoding").find("gzip") != std::string::npos;
        if (packed) answer.body = gzipPacked(answer.body);
        response.reset(MHD_create_response_from_buffer(answer.body.size(), answer.body.data(), MHD_RESPMEM_MUST_COPY));
    }
    if (!response) throw std::bad_alloc();
    if (hasBody) MHD_add_response_header(response.get(), "Content-Type", type.c_str());
    if (packed) MHD_add_response_header(response.get(), "Content-Encoding", "gzip");
    if (packable) MHD_add_response_header(response.get(), "Vary", "Accept-Encoding"); // for caches in between
    for (const auto& [name, value] : headers) MHD_add_response_header(response.get(), name.c_str(), value.c_str());
    return response;
}

} // namespace

struct HttpServer::Implementation {
    std::string certificate; // PEM; empty for plain HTTP
    std::string key;
    platform::FileHandle listener; // until the library owns it
    Handler handler;
    MHD_Daemon* daemon = nullptr;

    static Implementation& of(void* self) { return *static_cast<Implementation*>(self); }

    /// Stores the raw target before the library parses it.
    static void* begin(void*, const char* target, MHD_Connection*)
    {
        auto exchange = std::make_unique<Exchange>();
        const std::string_view text(target);
        const std::size_t mark = text.find('?');
        exchange->request.path = text.substr(0, mark);
        if (mark != text.npos) exchange->request.query = text.substr(mark + 1);
        return exchange.release();
    }
    static void end(void*, MHD_Connection*, void** state, MHD_RequestTerminationCode)
    {
        delete static_cast<Exchange*>(*state);
        *state = nullptr;
    }

    void fillIn(Request& request, MHD_Connection* connection, const char* method) const
    {
        request.method = method;
        request.secure = !certificate.empty();
        request.connection = MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD)->connect_fd;
        request.peer =
            endOf(*MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CLIENT_ADDRESS)->client_addr).first;
        MHD_get_connection_values(
            connection, MHD_HEADER_KIND,
            [](void* headers, MHD_ValueKind, const char* name, const char* value) {
                static_cast<Headers*>(headers)->emplace_back(name, value ? value : "");
                return MHD_YES;
            },
            &request.headers);
    }

    MHD_Result take(MHD_Connection* connection, const char* method, const char* piece, std::size_t* size,
                    Exchange& exchange)
    {
        Request& request = exchange.request;
        if (!exchange.begun) {
            exchange.begun = true;
            fillIn(request, connection, method);
            const std::string length = headerOf(request.headers, "Content-Length");
            std::size_t announced = 0;
            std::from_chars(length.data(), length.data() + length.size(), announced);
            if (announced > kMaximumBody) return refuse(connection);
            return MHD_YES;
        }
        if (*size > 0) {
            exchange.tooLarge = exchange.tooLarge || request.body.size() + *size > kMaximumBody;
            if (!exchange.tooLarge) request.body.append(piece, *size);
            *size = 0;
            return MHD_YES;
        }
        if (exchange.tooLarge) return refuse(connection);
        Answer answer = handler(request);
        const auto status = static_cast<unsigned>(answer.status);
        return MHD_queue_response(connection, status, responseOf(std::move(answer), request).get());
    }

    static MHD_Result refuse(MHD_Connection* connection)
    {
        const Answer answer = errorAnswer(413, "a body has " + std::to_string(kMaximumBody) + " bytes at most");
        return MHD_queue_response(connection, 413, responseOf(answer, {}).get());
    }
};

HttpServer::HttpServer(std::optional<tavrin::tools::CertificateFiles> certificate)
    : _implementation(std::make_unique<Implementation>())
{
    if (!certificate) return;
    _implementation->certificate = contentsOf(certificate->certificate);
    _implementation->key = contentsOf(certificate->key);
}

HttpServer::~HttpServer()
{
    stop();
}

std::expected<int, std::string> HttpServer::bind(const std::string& address, int port)
{
    addrinfo hints{};
    hints.ai_flags = AI_PASSIVE | AI_NUMERICSERV;
    hints.ai_socktype = SOCK_STREAM;
    addrinfo* found = nullptr;
    if (getaddrinfo(address.c_str(), std::to_string(port).c_str(), &hints, &found) != 0)
        return std::unexpected("no such address");
    const std::unique_ptr<addrinfo, decltype(&freeaddrinfo)> owner(found, freeaddrinfo);
    platform::FileHandle listener(socket(found->ai_family, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const int yes = 1;
    setsockopt(listener.fd(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes);
    sockaddr_storage bound{};
    socklen_t size = sizeof bound;
    if (::bind(listener.fd(), found->ai_addr, found->ai_addrlen) != 0 || listen(listener.fd(), kBacklog) != 0 ||
        getsockname(listener.fd(), reinterpret_cast<sockaddr*>(&bound), &size) != 0)
        return std::unexpected(errno == EADDRINUSE ? "taken" : std::strerror(errno));
    _implementation->listener = std::move(listener);
    return endOf(reinterpret_cast<const sockaddr&>(bound)).second;
}

void HttpServer::start(Handler handler)
{
    Implementation& self = *_implementation;
    self.handler = std::move(handler);
    std::vector<MHD_OptionItem> options{
        {MHD_OPTION_LISTEN_SOCKET, self.listener.fd(), nullptr},
        {MHD_OPTION_CONNECTION_TIMEOUT, kIdleSeconds, nullptr},
        {MHD_OPTION_CONNECTION_MEMORY_LIMIT, kConnectionMemory, nullptr},
        {MHD_OPTION_URI_LOG_CALLBACK, reinterpret_cast<std::intptr_t>(&Implementation::begin), nullptr},
        {MHD_OPTION_NOTIFY_COMPLETED, reinterpret_cast<std::intptr_t>(&Implementation::end), nullptr},
    };
    if (!self.certificate.empty()) {
        options.push_back({MHD_OPTION_HTTPS_MEM_CERT, 0, self.certificate.data()});
        options.push_back({MHD_OPTION_HTTPS_MEM_KEY, 0, self.key.data()});
    }
    options.push_back({MHD_OPTION_END, 0, nullptr});
    unsigned flags = MHD_USE_THREAD_PER_CONNECTION | MHD_USE_INTERNAL_POLLING_THREAD | MHD_USE_POLL;
    if (!self.certificate.empty()) flags |= MHD_USE_TLS;
    self.daemon = MHD_start_daemon(
        flags, 0, nullptr, nullptr,
        [](void* implementation, MHD_Connection* connection, const char*, const char* method, const char*,
           const char* piece, std::size_t* size, void** state) {
            return Implementation::of(implementation)
                .take(connection, method, piece, size, *static_cast<Exchange*>(*state));
        },
        &self, MHD_OPTION_ARRAY, options.data(), MHD_OPTION_END);
    if (!self.daemon) throw std::runtime_error("the HTTP server didn't start: the certificate can't be used");
    (void)self.listener.release();
}

void HttpServer::stop()
{
    if (MHD_Daemon* const daemon = std::exchange(_implementation->daemon, nullptr)) MHD_stop_daemon(daemon);
}

} // namespace devserver
