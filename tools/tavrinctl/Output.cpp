#include "tools/tavrinctl/Output.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include <fmt/format.h>

#include "platform/values/Json.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

constexpr int kProgressInterval = 1000; // milliseconds

/// Counts seconds on standard error until its destruction.
class Progress {
public:
    Progress() : _end(eventfd(0, EFD_CLOEXEC)), _thread([this] { run(); }) {}
    ~Progress()
    {
        eventfd_write(_end, 1);
        _thread.join();
        close(_end);
    }
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

private:
    void run() const
    {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_BLOCK, &all, nullptr); // signals are the main thread's
        pollfd end{.fd = _end, .events = POLLIN, .revents = 0};
        int seconds = 0;
        while (poll(&end, 1, kProgressInterval) == 0)
            fmt::print(stderr, "\r\033[KWaiting … {} s; Ctrl-C ends", ++seconds);
        if (seconds > 0) fmt::print(stderr, "\r\033[K");
    }

    const int _end;
    std::thread _thread;
};

std::optional<Progress> progress;
bool wantsPager = false;
pid_t pager = 0;

std::string pagerCommand()
{
    for (const char* name : {"TAVRINCTL_PAGER", "PAGER"})
        if (const char* command = std::getenv(name)) return command;
    return "less";
}

void startPager()
{
    const std::string command = pagerCommand();
    int ends[2];
    if (command.empty() || command == "cat" || isatty(STDOUT_FILENO) != 1 || pipe(ends) != 0) return;
    (void)colours(); // as of the terminal
    pager = fork();
    if (pager == 0) {
        dup2(ends[0], STDIN_FILENO);
        close(ends[0]);
        close(ends[1]);
        setenv("LESS", "FRX", 0);                                  // ends at once if all fits on the screen
        const std::string orElse = "\n[ $? -ne 127 ] || exec cat"; // there is no such program
        execl("/bin/sh", "sh", "-c", (command + orElse).c_str(), nullptr);
        _exit(127);
    }
    close(ends[0]);
    if (pager > 0) {
        dup2(ends[1], STDOUT_FILENO);
        std::signal(SIGPIPE, SIG_IGN); // the user may leave the pager before the end
        std::signal(SIGINT, SIG_IGN);  // Ctrl-C is for the pager
    }
    close(ends[1]);
}

} // namespace

void startProgress()
{
    if (isatty(STDERR_FILENO) == 1) progress.emplace();
}

void endProgress()
{
    progress.reset();
}

void pageOutput()
{
    wantsPager = true;
}

void endOutput()
{
    endProgress();
    if (pager <= 0) return;
    std::fflush(stdout);
    close(STDOUT_FILENO);
    while (waitpid(pager, nullptr, 0) < 0 && errno == EINTR) {}
    pager = 0;
}

void printText(std::string_view text)
{
    endProgress();
    if (std::exchange(wantsPager, false)) startPager();
    const std::string problem = tools::writeTo(stdout, text);
    if (problem.empty()) return;
    if (pager > 0) throw Failure("", EXIT_SUCCESS); // the user has left the pager
    throw Failure(problem);
}

void printLine(const std::string& text)
{
    printText(text + '\n');
}

void printJson(const platform::Value& value)
{
    printLine(tools::printableJson(platform::toJson(value, platform::JsonStyle::Pretty)));
}

void endOnSignal()
{
    static std::array<char, 1u << 20> buffer; // one write per line, which no signal interrupts
    std::setvbuf(stdout, buffer.data(), _IOFBF, buffer.size());
    struct sigaction action{};
    action.sa_handler = [](int) { _exit(EXIT_SUCCESS); };
    for (const int signal : {SIGINT, SIGTERM}) sigaction(signal, &action, nullptr);
}

bool colours()
{
    static const bool wanted = isatty(STDOUT_FILENO) == 1 && !std::getenv("NO_COLOR");
    return wanted;
}

std::string bold(const std::string& text)
{
    return colours() ? "\033[1m" + text + "\033[0m" : text;
}

std::string dim(const std::string& text)
{
    return colours() ? "\033[2m" + text + "\033[0m" : text;
}

} // namespace tavrin::ctl
