#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <limits>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <thread>
#include <vector>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"

namespace tavrin::bench {

/// Seconds on the monotonic clock.
[[nodiscard]] double now();
/// Seconds of CPU, user and system, that all threads of a process have used so far; 0 is this process.
[[nodiscard]] double cpu(pid_t pid = 0);
[[nodiscard]] double median(std::vector<double> values);
/// Seconds that `call` takes.
[[nodiscard]] double timeOf(const std::function<void()>& call);

/// Ends the process with what went wrong, and errno's text, unless `holds`.
void require(bool holds, const std::string& what);

/// The sum of the numbers that follow `key` in a file of /proc, in the unit that it has there.
[[nodiscard]] std::uint64_t numberIn(const std::filesystem::path& path, std::string_view key);
[[nodiscard]] double privateDirtyMegabytes(pid_t pid);
/// Waits, at no cost.
void pass(double seconds);

/// The limit of a figure that is reported only.
inline constexpr double kReportedOnly = std::numeric_limits<double>::infinity();

/// One line of the report: a figure of ours beside what it is compared with.
struct Row {
    std::string what;
    std::string ours;
    std::string beside; ///< empty: compared with nothing
    double figure = 0;  ///< the ratio, or the figure itself
    double limit = 0;   ///< at most
    std::string unit;   ///< of figure and limit; "×" for a ratio
};

/// Runs `ours` and `beside` in turn, `rounds` times each, and compares the medians of what they return (seconds).
[[nodiscard]] Row compare(std::string what, int rounds, double limit, const std::function<double()>& ours,
                          const std::function<double()>& beside);

/// The rows of a call to the daemon, beside `Echo` and beside `PlainServer`, from its seconds with each. The last two
/// have no limit: they say how much of the first is the daemon's own part.
[[nodiscard]] std::vector<Row> callRows(const std::string& what, double limit, double daemon, double server,
                                        double echo);

/// "123 ns", "12.3 µs", "4.5 ms".
[[nodiscard]] std::string seconds(double value);

/// Keeps this process and those that it starts on one core, until destroyed.
class OneCore {
public:
    OneCore();
    ~OneCore();
};

/// A private directory, removed with all that is in it.
class Directory {
public:
    Directory();
    ~Directory();
    Directory(const Directory&) = delete;
    Directory& operator=(const Directory&) = delete;
    [[nodiscard]] std::filesystem::path operator/(const std::string& name) const { return _path / name; }

private:
    std::filesystem::path _path;
};

/// A child process; killed when destroyed.
class Process {
public:
    /// `environment` is added to our own. A listening socket is passed on as a service manager does.
    Process(const std::vector<std::string>& command, const std::vector<std::string>& environment,
            std::optional<int> listeningSocket = std::nullopt);
    ~Process();
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;
    [[nodiscard]] pid_t pid() const { return _pid; }
    /// The first line that it writes to standard output; exits where there is none.
    [[nodiscard]] std::string firstLine();

private:
    pid_t _pid = -1;
    int _output = -1;
};

/// A Unix socket in the listening state.
[[nodiscard]] int listenAt(const std::string& path);

/// Private directories and a daemon in them, on a socket of ours. The daemon is `program`, tavrind if not given.
class Daemon {
public:
    /// `environment` may replace the private directories. `defaults` are user defaults beside the bag's URL.
    explicit Daemon(const std::string& bagURL, const std::vector<std::string>& environment = {},
                    const std::string& program = TAVRIND, platform::Dictionary defaults = {});
    [[nodiscard]] std::string address() const { return "unix:path=" + (_home / "run/socket").string(); }
    [[nodiscard]] pid_t pid() const { return _process->pid(); }
    /// A client that has configured itself; waits until it has the bag, where `withBag`.
    [[nodiscard]] std::unique_ptr<TAVClient> client(bool withBag = true, const std::string& agent = "bench/1") const
    {
        return clientAt(address(), withBag, agent);
    }
    /// The bytes that a call takes on its way to the daemon and back: they are counted between a client and the daemon.
    /// `call` is made twice, and the second time counts.
    struct Sizes {
        std::size_t call, reply;
    };
    [[nodiscard]] Sizes sizesOf(const std::function<void(TAVClient&)>& call) const;

private:
    [[nodiscard]] static std::unique_ptr<TAVClient> clientAt(const std::string& address, bool withBag,
                                                             const std::string& agent);
    Directory _home; // outlives the process
    std::unique_ptr<Process> _process;
};

/// A server on sd-bus that only replies, to each request with `answerSize` bytes, and drops events.
class PlainServer {
public:
    explicit PlainServer(std::size_t answerSize = 0);
    [[nodiscard]] pid_t pid() const { return _process->pid(); }
    [[nodiscard]] std::unique_ptr<TAVClient> client() const;

private:
    Directory _home; // outlives the process
    std::unique_ptr<Process> _process;
};

/// A process at the other end of a bare socket, that answers `call` bytes with `reply` bytes.
class Echo {
public:
    Echo(std::size_t call, std::size_t reply);
    explicit Echo(Daemon::Sizes sizes) : Echo(sizes.call, sizes.reply) {}
    ~Echo();
    Echo(const Echo&) = delete;
    Echo& operator=(const Echo&) = delete;
    void roundTrip();

private:
    std::size_t _call, _reply;
    std::string _message;
    int _socket = -1;
    pid_t _pid = -1;
};

/// A search service over HTTP on loopback: a bag at /bag, and the same JSON answer of `answerSize` bytes for everything
/// else, `delay` seconds late. A negative delay never answers anything. With a `query` the answer's result set says
/// that it is for that, and may be cached.
class Service {
public:
    explicit Service(std::size_t answerSize, double delay = 0, const std::string& query = {});
    ~Service();
    [[nodiscard]] std::string url(const std::string& path) const;
    void setDelay(double delay) { _delay = delay; }
    /// JSON to answer from now on.
    void setAnswer(std::string answer);

private:
    void serve(int connection);
    int _listener = -1;
    int _wake[2] = {-1, -1};
    unsigned _port = 0;
    std::mutex _answerMutex;
    std::string _answer; // under the mutex
    std::atomic<double> _delay;
    std::thread _acceptor;
    std::vector<std::thread> _threads;
};

// The benchmarks. Each prints what it is doing to standard error.
[[nodiscard]] std::vector<Row> ipc();
[[nodiscard]] std::vector<Row> search();
[[nodiscard]] std::vector<Row> hit();
[[nodiscard]] std::vector<Row> typing();
[[nodiscard]] std::vector<Row> images();
[[nodiscard]] std::vector<Row> startUp();
[[nodiscard]] std::vector<Row> memory();
[[nodiscard]] std::vector<Row> waiters();
[[nodiscard]] std::vector<Row> idle();
[[nodiscard]] std::vector<Row> cacheTree();
[[nodiscard]] std::vector<Row> httpCache();
[[nodiscard]] std::vector<Row> signature();
[[nodiscard]] std::vector<Row> lookupFilter();
[[nodiscard]] std::vector<Row> append();
[[nodiscard]] std::vector<Row> archive();
[[nodiscard]] std::vector<Row> flush();
[[nodiscard]] std::vector<Row> flushGrowth();
[[nodiscard]] std::vector<Row> events();
[[nodiscard]] std::vector<Row> millionEvents();
[[nodiscard]] std::vector<Row> growth();

} // namespace tavrin::bench
