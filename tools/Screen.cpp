#include "Screen.hpp"

#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include <csignal>
#include <iostream>
#include <string_view>

namespace brenix
{

namespace
{

termios settings{}; // of the terminal when there is no screen
volatile std::sig_atomic_t entered = 0;

void send(std::string_view text) noexcept
{
    const ssize_t sent = ::write(STDOUT_FILENO, text.data(), text.size());
    static_cast<void>(sent); // a terminal that is gone needs nothing
}

void enterScreen() noexcept
{
    termios quiet = settings;
    quiet.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
    quiet.c_cc[VMIN] = 0; // a read does not wait
    quiet.c_cc[VTIME] = 0;
    tcsetattr(STDOUT_FILENO, TCSANOW, &quiet);
    entered = 1;
    send("\033[?1049h\033[?7l\033[?25l"); // another screen, lines that do not wrap, no cursor
}

void catchOnce(int signal) noexcept;

/// Lets the signal do what it does by default. After a suspension the screen comes back.
void onSignal(int signal)
{
    const bool comesBack = entered != 0;
    leaveScreen();
    std::raise(signal);
    catchOnce(signal);
    if (comesBack) {
        enterScreen();
    }
}

void catchOnce(int signal) noexcept
{
    struct sigaction action {
    };
    action.sa_handler = onSignal;
    action.sa_flags = static_cast<int>(SA_RESETHAND) | SA_NODEFER;
    sigaction(signal, &action, nullptr);
}

} // namespace

Size terminalSize()
{
    winsize size{};
    if (ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) != 0 || size.ws_col == 0 || size.ws_row == 0) {
        return {};
    }
    return {size.ws_col, size.ws_row};
}

Screen::Screen()
{
    tcgetattr(STDOUT_FILENO, &settings);
    for (const int signal : {SIGTSTP, SIGHUP, SIGQUIT, SIGABRT, SIGSEGV, SIGBUS, SIGFPE, SIGILL}) {
        catchOnce(signal);
    }
    enterScreen();
}

Screen::~Screen()
{
    leaveScreen();
}

void leaveScreen() noexcept
{
    if (entered != 0) {
        entered = 0;
        send("\033[?25h\033[?7h\033[?1049l");
        tcsetattr(STDOUT_FILENO, TCSANOW, &settings);
    }
}

void Screen::show(const std::string& picture)
{
    std::cout << "\033[H";
    for (const char character : picture) {
        std::cout << (character == '\n' ? "\033[K\n" : std::string(1, character));
    }
    std::cout << "\033[J" << std::flush;
}

bool Screen::isTyped(char key)
{
    bool typed = false;
    for (char next = 0; ::read(STDOUT_FILENO, &next, 1) == 1;) { // a terminal is open both ways
        typed = typed || next == key;
    }
    return typed;
}

} // namespace brenix
