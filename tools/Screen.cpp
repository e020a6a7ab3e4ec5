#include "Screen.hpp"

#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
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

std::string printable(std::string_view text)
{
    std::string result;
    while (!text.empty()) {
        const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
        const std::size_t length = byte(0) < 0x80 ? 1 : byte(0) < 0xE0 ? 2 : byte(0) < 0xF0 ? 3 : 4;
        bool plain = length == 1 ? (byte(0) >= ' ' && byte(0) != 0x7F) || text[0] == '\n'
                                 : byte(0) >= 0xC2 && byte(0) < 0xF5 && length <= text.size();
        for (std::size_t i = 1; plain && i < length; ++i) {
            plain = (byte(i) & 0xC0U) == 0x80 && (byte(0) != 0xC2 || byte(i) >= 0xA0);
        }
        if (plain) {
            result += text.substr(0, length);
        } else {
            std::array<char, 8> escaped{};
            std::snprintf(escaped.data(), escaped.size(), "\\x%02x", byte(0));
            result += escaped.data();
        }
        text.remove_prefix(plain ? length : 1);
    }
    return result;
}

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
