#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <atomic>
#include <netinet/in.h>
#include <optional>
#include <poll.h>
#include <string>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

#include <fmt/format.h>

#include "fuzz/Check.h"
#include "platform/base/FileHandle.h"
#include "platform/net/ContentCoding.h"
#include "platform/net/UrlSession.h"
#include "platform/net/UrlSessionCurl.h"
#include "platform/run/Queue.h"
#include "platform/run/WorkerPool.h"
#include "tests/support/ManualClock.h"

using namespace platform;

namespace {

constexpr std::size_t kLargestBody = 256u << 10;

/// Removes what is before the next line "%%" and returns it.
std::string_view takePart(std::string_view& script)
{
    constexpr std::string_view kEnd = "\n%%\n";
    const std::string_view part = script.substr(0, script.find(kEnd));
    script.remove_prefix(std::min(part.size() + kEnd.size(), script.size()));
    return part;
}

/// A service, and a proxy for all others, so that no redirect leaves the process.
class Service {
public:
    Service()
        : _listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)), _done(eventfd(0, EFD_CLOEXEC))
    {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof address;
        check(bind(_listener.fd(), reinterpret_cast<const sockaddr*>(&address), size) == 0);
        check(listen(_listener.fd(), 64) == 0);
        check(getsockname(_listener.fd(), reinterpret_cast<sockaddr*>(&address), &size) == 0);
        const std::string url = fmt::format("http://127.0.0.1:{}", ntohs(address.sin_port));
        for (const char* name : {"http_proxy", "https_proxy", "all_proxy"}) setenv(name, url.c_str(), 1);
        for (const char* name : {"no_proxy", "NO_PROXY", "HTTPS_PROXY", "ALL_PROXY"}) unsetenv(name);
    }

    /// Any thread.
    void stop() const { eventfd_write(_done.fd(), 1); }

    /// Answers each request with a part of the script until `stop` is called. Closes the connection after the answer,
    /// unless its part begins with "~"; then the connection is kept while requests come. Returns the number of
    /// requests.
    int serve(std::string_view& script)
    {
        constexpr int kWithoutRequest = 5; // milliseconds, until kept connections are closed
        int requests = 0;
        std::vector<Connection> connections;
        for (;;) {
            std::vector<pollfd> watched{{_done.fd(), POLLIN, 0}, {_listener.fd(), POLLIN, 0}};
            bool anyKept = false;
            for (const Connection& connection : connections) {
                watched.push_back({connection.socket.fd(), POLLIN, 0});
                anyKept = anyKept || !connection.isClosed;
            }
            if (poll(watched.data(), watched.size(), anyKept ? kWithoutRequest : -1) == 0)
                for (Connection& connection : connections) connection.close();
            if (watched[0].revents != 0) break;
            for (std::size_t i = connections.size(); i-- > 0;)
                if (watched[2 + i].revents != 0 && !answer(connections[i], script, requests))
                    connections.erase(connections.begin() + static_cast<std::ptrdiff_t>(i));
            if (watched[1].revents != 0)
                connections.push_back(
                    {FileHandle(accept4(_listener.fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK))});
        }
        eventfd_t count = 0;
        eventfd_read(_done.fd(), &count);
        return requests;
    }

private:
    struct Connection {
        FileHandle socket;
        std::string received{};
        bool isClosed = false;

        void close()
        {
            isClosed = true;
            shutdown(socket.fd(), SHUT_WR);
        }
    };

    /// Returns false at the end of a connection.
    static bool answer(Connection& connection, std::string_view& script, int& requests)
    {
        std::array<char, 4096> buffer{};
        const ssize_t count = recv(connection.socket.fd(), buffer.data(), buffer.size(), 0);
        if (count <= 0) return count < 0 && errno == EAGAIN;
        connection.received.append(buffer.data(), static_cast<std::size_t>(count));
        if (!connection.received.contains("\r\n\r\n")) return true;
        connection.received.clear();
        ++requests;
        std::string_view part = takePart(script);
        const bool isKept = part.starts_with('~');
        if (isKept) part.remove_prefix(1);
        (void)send(connection.socket.fd(), part.data(), part.size(), MSG_NOSIGNAL);
        if (!isKept) connection.close();
        return true;
    }

    const FileHandle _listener;
    const FileHandle _done;
};

struct Outcome {
    std::optional<Bytes> data;
    std::optional<UrlResponse> response;
    std::optional<Error> error;
};

struct House {
    Service service; // sets the proxy before the first load
    test::ManualClock clock;
    WorkerPool pool{2};
    std::shared_ptr<Queue> queue = Queue::make("delegate", Queue::Kind::Serial, pool, clock);
    std::unique_ptr<UrlLoader> loader = makeCurlLoader(pool, clock);

    Outcome load(UrlSession& session, UrlRequest request, int file, std::string_view& script, int& requests)
    {
        Outcome outcome;
        int completions = 0;
        const auto completion = [&](auto data, auto response, auto error) {
            check(++completions == 1, "completed twice");
            outcome = {std::move(data), std::move(response), std::move(error)};
            service.stop();
        };
        const auto task =
            file < 0 ? session.dataTask(std::move(request), completion)
                     : session.transferTask(std::move(request), {.download = FileHandle(dup(file))}, completion);
        task->resume();
        requests = service.serve(script);
        queue->sync([] {}); // the completion has returned
        return outcome;
    }
};

void checkOutcome(const Outcome& outcome, std::string_view method)
{
    const auto& [data, response, error] = outcome;
    check(data.has_value() != error.has_value());
    if (error) check(error->domain == kUrlErrorDomain && !error->reason().empty(), error->description());
    if (data) {
        check(response && response->isHttp && response->statusCode >= 200, std::to_string(data->size()));
        check(data->size() <= kLargestBody && (method != "HEAD" || data->empty()), std::to_string(data->size()));
    }
    if (!response) return;
    check(Url::parse(response->url.string()) == response->url, response->url.string());
    for (const auto& [name, value] : response->headers)
        check(!name.empty() && (name + value).find_first_of(std::string_view("\r\n\0", 3)) == std::string::npos, name);
}

/// Decodes a body in pieces of `size` bytes. Returns nothing if it doesn't fit its codings or becomes too large.
std::optional<std::string> decoded(std::string_view body, std::string_view codings, std::size_t size)
{
    ContentDecoder decoder(codings);
    std::string out;
    const auto keep = [&out](std::string_view bytes) {
        out += bytes;
        return out.size() <= kLargestBody;
    };
    for (; !body.empty(); body.remove_prefix(std::min(size, body.size())))
        if (!decoder.feed(body.substr(0, size), keep)) return std::nullopt;
    return decoder.finished() ? std::optional(out) : std::nullopt;
}

/// Where the network cuts a body doesn't matter.
void checkPieces(std::string_view script)
{
    while (!script.empty()) {
        const std::string_view part = takePart(script);
        const auto body = part.find("\r\n\r\n");
        if (body == std::string_view::npos) continue;
        for (const std::string_view codings : {"gzip", "deflate", "gzip, deflate"}) {
            const auto whole = decoded(part.substr(body + 4), codings, SIZE_MAX);
            check(whole == decoded(part.substr(body + 4), codings, 1), std::string(codings));
        }
    }
}

} // namespace

/// The first line has letters: c for a session with a cache, where the load is repeated; f for a transfer into a file;
/// h for HEAD; p for a POST with a body. The rest is what the service answers to one request after the other, parted by
/// lines "%%". Each load ends with a response or an error that says why, and twice with the same body if the cache
/// answered.
void runInput(std::string_view input)
{
    static House& house = *new House();
    const std::string_view letters = takeLine(input);
    checkPieces(input);

    // Without authorities TLS fails at once. Reading the system's would take most of the time.
    UrlSessionConfiguration configuration{
        .maximumResponseSize = kLargestBody, .maximumRedirects = 3, .caFile = "/dev/null"};
    if (letters.contains('c')) configuration.cache = HttpCacheConfiguration{.clock = &house.clock};
    const auto session = house.loader->makeSession(configuration, house.queue);
    UrlRequest request{.url = *Url::parse("http://service.example/a?b")};
    if (letters.contains('h')) request.method = "HEAD";
    if (letters.contains('p')) {
        request.method = "POST";
        request.body = Bytes("body");
    }
    const FileHandle file(letters.contains('f') ? memfd_create("download", MFD_CLOEXEC) : -1);

    int requests = 0;
    const Outcome first = house.load(*session, request, file.fd(), input, requests);
    checkOutcome(first, request.method);
    if (file && first.data) {
        struct stat status{};
        check(fstat(file.fd(), &status) == 0 && static_cast<std::size_t>(status.st_size) <= kLargestBody);
    }
    if (!configuration.cache || file) return;
    const Outcome second = house.load(*session, request, -1, input, requests);
    checkOutcome(second, request.method);
    if (requests == 0 && first.data && second.data) check(first.data == second.data);
}
