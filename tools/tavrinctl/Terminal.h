#pragma once

#include <string>
#include <termios.h>

#include "tools/tavrinctl/SearchScreen.h"

namespace tavrin::ctl {

/// The terminal taken over for a full screen: keys come as they are typed, without echo, and what is shown is on the
/// terminal's other screen. Destroyed, or while suspended, everything is as it was, whatever ended the program short of
/// SIGKILL: SIGINT, SIGTERM and SIGHUP come as input. One at a time, one thread.
class Terminal {
public:
    /// A `Failure` where standard input and output are no terminal.
    Terminal();
    ~Terminal();
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    struct Input {
        std::string keys;
        bool resized = false;
        bool ended = false; ///< the terminal is gone
        int signal = 0;     ///< that asks the program to end; 0 for none
    };
    /// What came since the last time; doesn't wait.
    [[nodiscard]] Input read();
    /// Can be read when there is input.
    [[nodiscard]] int descriptor() const { return _input; }

    [[nodiscard]] ScreenSize size() const;
    void show(const std::string& bytes);
    /// Gives the terminal back and stops the program, as Ctrl-Z does; returns when it is continued. Where it
    /// was to end meanwhile the terminal stays as it is.
    void suspend();

private:
    void enter();
    void leave();

    termios _original{};
    bool _entered = false;
    sigset_t _signals{};
    sigset_t _originalSignals{};
    int _signalInput = -1;
    int _input = -1; // an epoll of the terminal and the signals
};

} // namespace tavrin::ctl
