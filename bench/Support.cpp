#include "bench/Support.h"

#include <algorithm>
#include <arpa/inet.h>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <poll.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace tavrin::bench {

namespace {

[[noreturn]] void die(const std::string& what)
{
    std::fprintf(stderr, "tavrin-bench: %s: %s\n", what.c_str(), std::strerror(errno));
    std::exit(1);
}

} // namespace

void require(bool holds, const std::string& what)
{
    if (!holds) die(what);
}

double now()
{
    timespec time{};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

double cpu(pid_t pid)
{
    clockid_t clock = CLOCK_PROCESS_CPUTIME_ID;
    timespec time{};
    require((pid == 0 || clock_getcpuclockid(pid, &clock) == 0) && clock_gettime(clock, &time) == 0, "CPU time");
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

double timeOf(const std::function<void()>& call)
{
    const double begin = now();
    call();
    return now() - begin;
}

std::uint64_t numberIn(const std::filesystem::path& path, std::string_view key)
{
    std::ifstream file(path);
    std::uint64_t sum = 0;
    for (std::string line; std::getline(file, line);)
        if (line.starts_with(key)) sum += std::strtoull(line.c_str() + key.size(), nullptr, 10);
    return sum;
}

double privateDirtyMegabytes(pid_t pid)
{
    return static_cast<double>(numberIn(fmt::format("/proc/{}/smaps_rollup", pid), "Private_Dirty:")) / 1024;
}

void pass(double seconds)
{
    poll(nullptr, 0, static_cast<int>(seconds * 1000));
}

double median(std::vector<double> values)
{
    std::ranges::sort(values);
    return values[values.size() / 2];
}

std::string seconds(double value)
{
    if (value < 1e-6) return fmt::format("{:.0f} ns", value * 1e9);
    if (value < 1e-3) return fmt::format("{:.1f} µs", value * 1e6);
    if (value < 1) return fmt::format("{:.2f} ms", value * 1e3);
    return fmt::format("{:.2f} s", value);
}

Row compare(std::string what, int rounds, double limit, const std::function<double()>& ours,
            const std::function<double()>& beside)
{
    std::vector<double> mine, others;
    for (int i = 0; i < rounds; ++i) {
        std::fprintf(stderr, "\r%s: round %d of %d ", what.c_str(), i + 1, rounds);
        mine.push_back(ours());
        others.push_back(beside());
    }
    std::fputc('\n', stderr);
    const double ratio = median(mine) / median(others);
    return {std::move(what), seconds(median(mine)), seconds(median(others)), ratio, limit, "×"};
}

std::vector<Row> callRows(const std::string& what, double limit, double daemon, double server, double echo)
{
    const auto row = [](std::string text, double ours, double beside, double atMost) {
        return Row{std::move(text), seconds(ours), seconds(beside), ours / beside, atMost, "×"};
    };
    return {row(what + ", beside a socket echo of as many bytes, on one core", daemon, echo, limit),
            row(what + ", beside a server on sd-bus that only replies", daemon, server, kReportedOnly),
            row("that server beside the echo", server, echo, kReportedOnly)};
}

OneCore::OneCore()
{
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(0, &one);
    require(sched_setaffinity(0, sizeof(one), &one) == 0, "sched_setaffinity");
}

OneCore::~OneCore()
{
    cpu_set_t all;
    CPU_ZERO(&all);
    for (int i = 0; i < CPU_SETSIZE; ++i) CPU_SET(i, &all);
    sched_setaffinity(0, sizeof(all), &all);
}

Process::Process(const std::vector<std::string>& command, const std::vector<std::string>& environment,
                 std::optional<int> listeningSocket)
{
    int output[2];
    require(pipe(output) == 0, "pipe");
    std::vector<std::string> variables = environment;
    std::vector<char*> arguments;
    for (const std::string& argument : command) arguments.push_back(const_cast<char*>(argument.c_str()));
    arguments.push_back(nullptr);
    _pid = fork();
    require(_pid >= 0, "fork");
    if (_pid == 0) {
        dup2(output[1], STDOUT_FILENO);
        for (const std::string& variable : variables) putenv(const_cast<char*>(variable.c_str()));
        if (listeningSocket) {
            dup2(*listeningSocket, 3);
            fcntl(3, F_SETFD, 0); // it may have been 3 already
            static char fds[] = "LISTEN_FDS=1";
            static char pid[32];
            std::snprintf(pid, sizeof(pid), "LISTEN_PID=%d", getpid());
            putenv(fds);
            putenv(pid);
        }
        for (int fd = listeningSocket ? 4 : 3; fd < 1024; ++fd) close(fd);
        execv(arguments[0], arguments.data());
        _exit(127);
    }
    close(output[1]);
    _output = output[0];
}

Process::~Process()
{
    kill(_pid, SIGKILL);
    waitpid(_pid, nullptr, 0);
    close(_output);
}

std::string Process::firstLine()
{
    std::string line;
    char c;
    while (read(_output, &c, 1) == 1) {
        if (c == '\n') return line;
        line += c;
    }
    die("a process ended early");
}

Echo::Echo(std::size_t call, std::size_t reply) : _call(call), _reply(reply), _message(std::max(call, reply), 'x')
{
    int sockets[2];
    require(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sockets) == 0, "socketpair");
    _pid = fork();
    require(_pid >= 0, "fork");
    if (_pid == 0) {
        close(sockets[0]);
        while (recv(sockets[1], _message.data(), call, MSG_WAITALL) == static_cast<ssize_t>(call))
            if (write(sockets[1], _message.data(), reply) != static_cast<ssize_t>(reply)) break;
        _exit(0);
    }
    close(sockets[1]);
    _socket = sockets[0];
}

Echo::~Echo()
{
    close(_socket);
    waitpid(_pid, nullptr, 0);
}

void Echo::roundTrip()
{
    require(write(_socket, _message.data(), _call) == static_cast<ssize_t>(_call) &&
                recv(_socket, _message.data(), _reply, MSG_WAITALL) == static_cast<ssize_t>(_reply),
            "a round trip");
}

namespace {

/// A Unix socket, and what `use` (bind or connect) makes of it at `path`.
int unixSocket(const std::string& path, int (*use)(int, const sockaddr*, socklen_t))
{
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{AF_UNIX, {}};
    std::strncpy(address.sun_path, path.c_str(), sizeof(address.sun_path) - 1);
    require(use(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0, path);
    return fd;
}

} // namespace

int listenAt(const std::string& path)
{
    const int fd = unixSocket(path, bind);
    require(listen(fd, 1024) == 0, path);
    return fd;
}

Directory::Directory()
{
    char pattern[] = "/tmp/tavrin-bench-XXXXXX";
    require(mkdtemp(pattern), pattern);
    _path = pattern;
}

Directory::~Directory()
{
    std::error_code ignored;
    std::filesystem::remove_all(_path, ignored);
}

Daemon::Daemon(const std::string& bagURL, const std::vector<std::string>& environment, const std::string& program,
               platform::Dictionary defaults)
{
    for (const char* name : {"run", "config", "cache", "state"}) std::filesystem::create_directory(_home / name);
    std::filesystem::permissions(_home / "run", std::filesystem::perms::owner_all);
    defaults.set("TAVBagURL", bagURL);
    std::ofstream(_home / "config/com.quorvane.tavrind.json") << platform::toJson(std::move(defaults));

    std::vector<std::string> variables;
    for (const auto& [variable, name] : {std::pair("XDG_RUNTIME_DIR", "run"), std::pair("XDG_CONFIG_HOME", "config"),
                                         std::pair("XDG_CACHE_HOME", "cache"), std::pair("XDG_STATE_HOME", "state")})
        variables.push_back(fmt::format("{}={}", variable, (_home / name).string()));
    variables.insert(variables.end(), environment.begin(), environment.end());
    const int socket = listenAt(_home / "run/socket");
    std::vector<std::string> command{program};
    if (program == TAVRIND) command.insert(command.end(), {"--log-level", "fault"});
    _process = std::make_unique<Process>(command, variables, socket);
    close(socket);
}

Daemon::Sizes Daemon::sizesOf(const std::function<void(TAVClient&)>& call) const
{
    const std::string path = _home / "counted";
    const int listener = listenAt(path);
    std::atomic<std::size_t> counts[2] = {0, 0};
    std::thread relay([&, daemon = unixSocket(_home / "run/socket", connect)] {
        pollfd ends[] = {{accept4(listener, nullptr, nullptr, SOCK_CLOEXEC), POLLIN, 0}, {daemon, POLLIN, 0}};
        std::vector<char> bytes(1 << 16);
        for (bool open = true; open;) {
            poll(ends, 2, -1);
            for (int from = 0; from < 2; ++from) {
                if (!ends[from].revents) continue;
                const ssize_t count = read(ends[from].fd, bytes.data(), bytes.size());
                if (count <= 0) {
                    open = false;
                    break;
                }
                counts[from] += static_cast<std::size_t>(count);
                require(write(ends[1 - from].fd, bytes.data(), static_cast<std::size_t>(count)) == count, "a relay");
            }
        }
        for (const pollfd& end : ends) close(end.fd);
    });
    Sizes sizes{};
    {
        const auto client = clientAt("unix:path=" + path, true, "bench/1");
        call(*client);
        const std::size_t before[] = {counts[0], counts[1]};
        call(*client);
        sizes = {counts[0] - before[0], counts[1] - before[1]};
    }
    relay.join();
    close(listener);
    return sizes;
}

std::unique_ptr<TAVClient> Daemon::clientAt(const std::string& address, bool withBag, const std::string& agent)
{
    auto client = TAVClient::connect(address);
    require(client.has_value(), "the daemon doesn't answer");
    bool bagArrived = false;
    (*client)->onBagDidLoad([&](const TAVBagAnswer& answer) { bagArrived = bagArrived || answer.bag; });
    require((*client)->configure({"com.quorvane.bench", agent}).has_value(), "configure");
    if (withBag) require((*client)->wait([&] { return bagArrived; }, std::chrono::seconds(30)), "no bag");
    (*client)->onBagDidLoad([](const TAVBagAnswer&) {});
    return std::move(*client);
}

PlainServer::PlainServer(std::size_t answerSize)
{
    const int socket = listenAt(_home / "socket");
    _process = std::make_unique<Process>(std::vector<std::string>{SERVER, std::to_string(answerSize)},
                                         std::vector<std::string>{}, socket);
    close(socket);
}

std::unique_ptr<TAVClient> PlainServer::client() const
{
    auto client = TAVClient::connect("unix:path=" + (_home / "socket").string());
    require(client.has_value(), "the server doesn't answer");
    return std::move(*client);
}

Service::Service(std::size_t answerSize, double delay, const std::string& query) : _delay(delay)
{
    // Results as a service sends them, as many as fill the size.
    _answer = R"([{"status":"OK",)" + (query.empty() ? "" : fmt::format(R"("query":"{}",)", query)) +
              R"("fbq":"7f","duration":1.5,"results":[)";
    for (int i = 0; _answer.size() + 3 < answerSize; ++i)
        _answer +=
            fmt::format(R"({}{{"title":"Result number {} — résumé","url":"https://result.example/page/{}?from=search",)"
                        R"("description":"What this page is about, in a sentence or two.","score":{}.{},"type":1}})",
                        i ? "," : "", i, i * 37, i % 10, i);
    _answer += "]}]";

    _listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t length = sizeof(address);
    require(bind(_listener, reinterpret_cast<sockaddr*>(&address), length) == 0 && listen(_listener, 1024) == 0 &&
                getsockname(_listener, reinterpret_cast<sockaddr*>(&address), &length) == 0 && pipe(_wake) == 0,
            "a loopback socket");
    _port = ntohs(address.sin_port);
    _acceptor = std::thread([this] {
        for (;;) {
            pollfd fds[] = {{_listener, POLLIN, 0}, {_wake[0], POLLIN, 0}};
            poll(fds, 2, -1);
            if (fds[1].revents) return;
            const int connection = accept4(_listener, nullptr, nullptr, SOCK_CLOEXEC);
            if (connection >= 0) _threads.emplace_back([this, connection] { serve(connection); });
        }
    });
}

Service::~Service()
{
    require(write(_wake[1], "x", 1) == 1, "pipe");
    _acceptor.join();
    for (std::thread& thread : _threads) thread.join();
    for (const int fd : {_listener, _wake[0], _wake[1]}) close(fd);
}

std::string Service::url(const std::string& path) const
{
    return fmt::format("http://127.0.0.1:{}{}", _port, path);
}

void Service::setAnswer(std::string answer)
{
    const std::lock_guard lock(_answerMutex);
    _answer = std::move(answer);
}

void Service::serve(int connection)
{
    std::string received;
    char buffer[16384];
    for (;;) {
        pollfd fds[] = {{connection, POLLIN, 0}, {_wake[0], POLLIN, 0}};
        poll(fds, 2, -1);
        const ssize_t got = fds[1].revents ? 0 : read(connection, buffer, sizeof(buffer));
        if (got <= 0) break;
        received.append(buffer, static_cast<std::size_t>(got));
        const auto end = received.find("\r\n\r\n");
        if (end == std::string::npos || _delay < 0) continue;
        const bool bag = received.starts_with("GET /bag");
        received.erase(0, end + 4);
        if (!bag && _delay > 0) poll(&fds[1], 1, static_cast<int>(_delay * 1000));
        std::unique_lock lock(_answerMutex);
        const std::string body =
            bag ? platform::toJson(platform::Value::dictionaryOf({{"version", "1"}, {"searchURL", url("/search")}}))
                : _answer;
        lock.unlock();
        const std::string answer = fmt::format(
            "HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nContent-Length: {}\r\n\r\n{}", body.size(), body);
        if (send(connection, answer.data(), answer.size(), MSG_NOSIGNAL) < 0) break;
    }
    close(connection);
}

} // namespace tavrin::bench
