#include "tests/support/TestHttpServer.h"

#include <array>
#include <csignal>
#include <cstdlib>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sstream>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>

#include <fmt/format.h>
#include <gtest/gtest.h>
#include <openssl/ssl.h>

#include "platform/files/Files.h"

namespace platform::test {

namespace {

template <auto Free> struct FreeWith {
    template <class T> void operator()(T* object) const { Free(object); }
};
using SslContext = std::unique_ptr<SSL_CTX, FreeWith<SSL_CTX_free>>;
using Ssl = std::unique_ptr<SSL, FreeWith<SSL_free>>;

SslContext makeTls(const tavrin::tools::CertificateFiles& files, bool anyProtocol)
{
    SslContext context(SSL_CTX_new(TLS_server_method()));
    SSL_CTX_use_certificate_file(context.get(), files.certificate.c_str(), SSL_FILETYPE_PEM);
    SSL_CTX_use_PrivateKey_file(context.get(), files.key.c_str(), SSL_FILETYPE_PEM);
    const auto choose = [](SSL*, const unsigned char** chosen, unsigned char* length, const unsigned char* offered,
                           unsigned offeredLength, void*) {
        static constexpr unsigned char kKnown[] = "\x02h2\x08http/1.1";
        unsigned char* found = nullptr;
        if (SSL_select_next_proto(&found, length, kKnown, sizeof kKnown - 1, offered, offeredLength) !=
            OPENSSL_NPN_NEGOTIATED)
            return SSL_TLSEXT_ERR_NOACK;
        *chosen = found;
        return SSL_TLSEXT_ERR_OK;
    };
    if (anyProtocol) SSL_CTX_set_alpn_select_cb(context.get(), choose, nullptr);
    return context;
}

/// Parses a complete request and returns its length; 0 if it is incomplete.
std::size_t requestLength(const std::string& bytes, TestHttpServer::Request& request)
{
    const std::size_t end = bytes.find("\r\n\r\n");
    if (end == std::string::npos) return 0;
    request.head = bytes.substr(0, end + 2);
    const std::size_t bodyLength = std::strtoul(request.header("Content-Length").c_str(), nullptr, 10);
    const std::size_t whole = end + 4 + bodyLength;
    if (bytes.size() < whole) return 0;
    std::istringstream(request.head) >> request.method >> request.target;
    request.body = bytes.substr(end + 4, bodyLength);
    return whole;
}

} // namespace

std::string TestHttpServer::Request::header(std::string_view name) const
{
    const std::string start = fmt::format("\r\n{}:", name);
    std::size_t at = head.find(start);
    if (at == std::string::npos) return {};
    at += start.size();
    while (head[at] == ' ') ++at;
    return head.substr(at, head.find("\r\n", at) - at);
}

struct TestHttpServer::Impl {
    struct Connection {
        FileHandle socket;
        Ssl ssl;
        std::string received;
    };

    Handler handler;
    Options options;
    FileHandle listener;
    FileHandle wake{eventfd(0, EFD_CLOEXEC)};
    std::uint16_t port = 0;
    SslContext tls;
    std::map<int, Connection> open; // by descriptor; server thread only

    std::mutex mutex;
    std::condition_variable changed;
    std::vector<Request> requests;   // under the mutex
    int connections = 0;             // under the mutex
    std::optional<Answer> sentToAll; // under the mutex
    bool stopping = false;           // under the mutex
    std::thread thread;

    void listen()
    {
        const addrinfo numeric{.ai_flags = AI_NUMERICHOST | AI_PASSIVE, .ai_socktype = SOCK_STREAM};
        addrinfo* address = nullptr;
        getaddrinfo(options.address.c_str(), "0", &numeric, &address);
        listener = FileHandle(socket(address->ai_family, SOCK_STREAM | SOCK_CLOEXEC, 0));
        sockaddr_in6 bound{}; // has the port where an IPv4 address has it
        socklen_t size = sizeof bound;
        if (bind(listener.fd(), address->ai_addr, address->ai_addrlen) != 0 || ::listen(listener.fd(), 64) != 0 ||
            getsockname(listener.fd(), reinterpret_cast<sockaddr*>(&bound), &size) != 0)
            ADD_FAILURE() << "no server at " << options.address << ": " << Error::posix(errno).description();
        freeaddrinfo(address);
        port = ntohs(bound.sin6_port);
    }

    void run()
    {
        sigset_t brokenPipe; // OpenSSL writes without MSG_NOSIGNAL
        sigemptyset(&brokenPipe);
        sigaddset(&brokenPipe, SIGPIPE);
        pthread_sigmask(SIG_BLOCK, &brokenPipe, nullptr);
        while (true) {
            std::vector<pollfd> watched{{wake.fd(), POLLIN, 0}, {listener.fd(), POLLIN, 0}};
            for (const auto& [fd, connection] : open) watched.push_back({fd, POLLIN, 0});
            if (poll(watched.data(), watched.size(), -1) < 0) continue;
            if (watched[0].revents && !obey()) return;
            if (watched[1].revents) accept();
            for (std::size_t i = 2; i < watched.size(); ++i) {
                const auto found = open.find(watched[i].fd);
                if (watched[i].revents && found != open.end() && !serve(found->second)) open.erase(found);
            }
        }
    }

    /// Handles a wake-up by the test. Returns false to stop the server.
    bool obey()
    {
        eventfd_t count = 0;
        eventfd_read(wake.fd(), &count);
        std::lock_guard lock(mutex);
        for (auto entry = open.begin(); sentToAll && entry != open.end();)
            entry = answer(entry->second, *sentToAll) ? std::next(entry) : open.erase(entry);
        sentToAll.reset();
        changed.notify_all();
        return !stopping;
    }

    void accept()
    {
        Connection connection;
        connection.socket = FileHandle(accept4(listener.fd(), nullptr, nullptr, SOCK_CLOEXEC));
        {
            std::lock_guard lock(mutex);
            ++connections;
        }
        if (tls) {
            connection.ssl.reset(SSL_new(tls.get()));
            SSL_set_fd(connection.ssl.get(), connection.socket.fd());
            if (SSL_accept(connection.ssl.get()) != 1) return;
        }
        const int fd = connection.socket.fd();
        open.emplace(fd, std::move(connection));
    }

    /// Reads available bytes and answers complete requests. Returns false to close the connection.
    bool serve(Connection& connection)
    {
        do {
            std::array<char, 16 * 1024> chunk;
            const int count = connection.ssl
                                  ? SSL_read(connection.ssl.get(), chunk.data(), chunk.size())
                                  : static_cast<int>(recv(connection.socket.fd(), chunk.data(), chunk.size(), 0));
            if (count <= 0) return false;
            connection.received.append(chunk.data(), static_cast<std::size_t>(count));
        } while (connection.ssl && SSL_pending(connection.ssl.get()) > 0);

        Request request{.resumed = connection.ssl && SSL_session_reused(connection.ssl.get()) == 1};
        if (options.anyProtocol) {
            request.body = std::exchange(connection.received, {});
            return answer(connection, handler(request));
        }
        while (const std::size_t length = requestLength(connection.received, request)) {
            connection.received.erase(0, length);
            {
                std::lock_guard lock(mutex);
                requests.push_back(request);
            }
            changed.notify_all();
            if (!answer(connection, handler(request))) return false;
        }
        return true;
    }

    /// Sends the answer. Returns false to close the connection.
    static bool answer(Connection& connection, const Answer& answer)
    {
        send(connection, answer.bytes);
        if (answer.then == Then::Reset) {
            const linger atOnce{.l_onoff = 1, .l_linger = 0};
            setsockopt(connection.socket.fd(), SOL_SOCKET, SO_LINGER, &atOnce, sizeof atOnce);
        } else if (answer.then == Then::Close && connection.ssl) {
            SSL_shutdown(connection.ssl.get()); // as servers do
        }
        return answer.then == Then::KeepOpen;
    }

    /// Ignores errors: the client may have closed the connection.
    static void send(Connection& connection, std::string_view bytes)
    {
        while (!bytes.empty()) {
            const auto count = connection.ssl
                                   ? SSL_write(connection.ssl.get(), bytes.data(), static_cast<int>(bytes.size()))
                                   : ::send(connection.socket.fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count <= 0) return;
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
    }
};

TestHttpServer::TestHttpServer(Handler handler) : TestHttpServer(std::move(handler), Options()) {}

TestHttpServer::TestHttpServer(Handler handler, const Options& options) : _impl(std::make_unique<Impl>())
{
    _impl->handler = std::move(handler);
    _impl->options = options;
    if (options.certificate) _impl->tls = makeTls(*options.certificate, options.anyProtocol);
    _impl->listen();
    _impl->thread = std::thread([impl = _impl.get()] { impl->run(); });
}

TestHttpServer::~TestHttpServer()
{
    {
        std::lock_guard lock(_impl->mutex);
        _impl->stopping = true;
    }
    eventfd_write(_impl->wake.fd(), 1);
    _impl->thread.join();
}

Url TestHttpServer::url(std::string_view target) const
{
    const bool isV6 = _impl->options.address.contains(':');
    return *Url::parse(fmt::format("{}://{}:{}{}", _impl->tls ? "https" : "http",
                                   isV6 ? "[" + _impl->options.address + "]" : _impl->options.address, _impl->port,
                                   target));
}

int TestHttpServer::connections() const
{
    std::lock_guard lock(_impl->mutex);
    return _impl->connections;
}

std::vector<TestHttpServer::Request> TestHttpServer::requests() const
{
    std::lock_guard lock(_impl->mutex);
    return _impl->requests;
}

void TestHttpServer::waitForRequests(std::size_t count)
{
    std::unique_lock lock(_impl->mutex);
    _impl->changed.wait(lock, [&] { return _impl->requests.size() >= count; });
}

void TestHttpServer::sendToAll(const Answer& answer)
{
    std::unique_lock lock(_impl->mutex);
    _impl->sentToAll = answer;
    eventfd_write(_impl->wake.fd(), 1);
    _impl->changed.wait(lock, [&] { return !_impl->sentToAll; });
}

std::string httpAnswer(int status, std::string_view body, std::string_view fields)
{
    return fmt::format("HTTP/1.1 {} Reason\r\n{}Content-Length: {}\r\n\r\n{}", status, fields, body.size(), body);
}

TestHttpServer::Handler byPath(std::map<std::string, TestHttpServer::Answer> answers)
{
    return [answers = std::move(answers)](const TestHttpServer::Request& request) {
        const auto found = answers.find(request.target);
        return found == answers.end() ? TestHttpServer::Answer{httpAnswer(404, "no such path")} : found->second;
    };
}

TestHttpServer::Handler always(TestHttpServer::Answer answer)
{
    return [answer = std::move(answer)](const TestHttpServer::Request&) { return answer; };
}

} // namespace platform::test
