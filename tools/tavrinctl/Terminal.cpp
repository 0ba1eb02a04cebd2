#include "tools/tavrinctl/Terminal.h"

#include <cerrno>
#include <csignal>
#include <sys/epoll.h>
#include <sys/ioctl.h>
#include <sys/signalfd.h>
#include <unistd.h>
#include <utility>

#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

namespace {

// The alternate screen, without wrapping of long lines.
constexpr const char* kEnter = "\033[?1049h\033[?7l\033[H\033[2J";
constexpr const char* kLeave = "\033[0m\033[?25h\033[?7h\033[?1049l";

/// Signals that ask the program to end.
constexpr int kEnding[]{SIGINT, SIGTERM, SIGHUP, SIGQUIT};

void watch(int epoll, int descriptor)
{
    epoll_event event{.events = EPOLLIN, .data = {.fd = descriptor}};
    if (epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event) != 0) throw Failure("can't watch the terminal");
}

} // namespace

Terminal::Terminal()
{
    if (isatty(STDIN_FILENO) != 1 || isatty(STDOUT_FILENO) != 1 || tcgetattr(STDIN_FILENO, &_original) != 0)
        throw Failure("--interactive needs a terminal; use --typed in scripts", 2);
    endProgress();
    sigemptyset(&_signals);
    sigaddset(&_signals, SIGWINCH);
    for (const int signal : kEnding) sigaddset(&_signals, signal);
    _signalInput = signalfd(-1, &_signals, SFD_CLOEXEC | SFD_NONBLOCK);
    _input = epoll_create1(EPOLL_CLOEXEC);
    watch(_input, STDIN_FILENO);
    watch(_input, _signalInput);
    sigprocmask(SIG_BLOCK, &_signals, &_originalSignals);
    enter();
}

Terminal::~Terminal()
{
    leave();
    sigprocmask(SIG_SETMASK, &_originalSignals, nullptr);
    close(_input);
    close(_signalInput);
}

void Terminal::enter()
{
    termios raw = _original;
    cfmakeraw(&raw);
    raw.c_cc[VMIN] = 0; // reads never block
    raw.c_cc[VTIME] = 0;
    tcsetattr(STDIN_FILENO, TCSADRAIN, &raw);
    show(kEnter);
    _entered = true;
}

void Terminal::leave()
{
    if (!std::exchange(_entered, false)) return;
    show(kLeave);
    tcsetattr(STDIN_FILENO, TCSAFLUSH, &_original); // drops unread keys, so that the shell does not get them
}

Terminal::Input Terminal::read()
{
    Input input;
    epoll_event ready[2];
    const int count = epoll_wait(_input, ready, 2, 0);
    for (int i = 0; i < count; ++i) {
        if (ready[i].data.fd == STDIN_FILENO) {
            char keys[4096];
            const ssize_t length = ::read(STDIN_FILENO, keys, sizeof(keys));
            if (length > 0)
                input.keys.assign(keys, static_cast<std::size_t>(length));
            else if (length == 0 || errno != EINTR)
                input.ended = true;
        } else {
            signalfd_siginfo signal{};
            while (::read(_signalInput, &signal, sizeof(signal)) == sizeof(signal)) {
                if (signal.ssi_signo == SIGWINCH)
                    input.resized = true;
                else
                    input.signal = static_cast<int>(signal.ssi_signo);
            }
        }
    }
    return input;
}

ScreenSize Terminal::size() const
{
    winsize size{};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_col == 0 || size.ws_row == 0) return {};
    return {size.ws_col, size.ws_row};
}

void Terminal::show(const std::string& bytes)
{
    for (std::size_t done = 0; done < bytes.size();) {
        const ssize_t written = write(STDOUT_FILENO, bytes.data() + done, bytes.size() - done);
        if (written > 0)
            done += static_cast<std::size_t>(written);
        else if (errno != EINTR)
            return; // the terminal was closed
    }
}

void Terminal::suspend()
{
    leave();
    raise(SIGSTOP);
    sigset_t pending;
    sigpending(&pending);
    for (const int signal : kEnding)
        if (sigismember(&pending, signal) == 1) return; // in the background the terminal would stop us again
    enter();
}

} // namespace tavrin::ctl
