#pragma once

#include <string>
#include <termios.h>

#include "tools/tavrinctl/SearchScreen.h"

namespace tavrin::ctl {

/// Puts the terminal into raw mode on its alternate screen. The destructor and `suspend` restore it. SIGINT, SIGTERM,
/// SIGHUP and SIGQUIT arrive as input, so that they don't leave the terminal changed. At most one instance; not
/// thread-safe.
class Terminal {
public:
    /// Throws `Failure` if standard input or output is not a terminal.
    Terminal();
    ~Terminal();
    Terminal(const Terminal&) = delete;
    Terminal& operator=(const Terminal&) = delete;

    struct Input {
        std::string keys;
        bool resized = false;
        bool ended = false; ///< the terminal was closed
        int signal = 0;     ///< signal that asks the program to end; 0 if none
    };
    /// Returns the input since the last call without blocking.
    [[nodiscard]] Input read();
    /// Becomes readable when there is input.
    [[nodiscard]] int descriptor() const { return _input; }

    [[nodiscard]] ScreenSize size() const;
    void show(const std::string& bytes);
    /// Restores the terminal and stops the process, as Ctrl-Z does; returns after SIGCONT. If a signal has asked the
    /// program to end by then, the terminal stays restored.
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
