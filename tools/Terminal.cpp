// What the commands have to do with the terminal.

#include "Screen.hpp"
#include "commands/Commands.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <string>

namespace brenix
{

namespace
{

volatile std::sig_atomic_t interrupted = 0;

} // namespace

void catchInterrupts()
{
    // A file or a socket that is opened later must not take the place of one that is closed. What is then
    // written to the standard output fails.
    int opened = 0;
    while (opened >= 0 && opened <= STDERR_FILENO) {
        opened = ::open("/dev/null", O_RDONLY);
    }
    ::close(opened);
    struct sigaction action {
    };
    action.sa_handler = [](int /*signal*/) {
        interrupted = interrupted + 1;
        if (interrupted == 3) { // the order is taking too long
            leaveScreen();
            _exit(Interrupted);
        }
        endInput();
    };
    action.sa_flags = SA_RESTART; // a write to a pipe that is full goes on, a read finds the end
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
}

void endInput()
{
    const int error = errno;
    const int nothing = ::open("/dev/null", O_RDONLY);
    ::dup2(nothing, STDIN_FILENO);
    ::close(nothing);
    errno = error;
}

bool isInterrupted()
{
    return interrupted != 0;
}

double secondsSince(std::chrono::steady_clock::time_point start)
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

Progress::Progress(double totalCounts, bool quiet)
    : total(std::isfinite(totalCounts) ? totalCounts : 0),
      shown(!quiet && isatty(STDERR_FILENO) != 0)
{
}

void Progress::update(double counts)
{
    if (!shown || secondsSince(drawn) < 0.1) {
        return;
    }
    drawn = std::chrono::steady_clock::now();
    const double seconds = secondsSince(start);
    const double rate = counts / seconds;
    std::fprintf(stderr, "\r\033[K");
    if (total > 0) {
        constexpr int width = 30;
        const double part = std::min(counts / total, 1.0);
        const auto filled = static_cast<std::size_t>(part * width);
        std::fprintf(stderr, "[%s%s] %3.0f%%  %.4g counts/s  %.0f s left",
                     std::string(filled, '#').c_str(), std::string(width - filled, '.').c_str(),
                     100 * part, rate, std::max(total - counts, 0.0) / rate);
    } else {
        std::fprintf(stderr, "%.0f counts  %.4g counts/s  %.0f s", counts, rate, seconds);
    }
}

void Progress::finish() const
{
    if (shown) {
        std::fprintf(stderr, "\r\033[K");
    }
}

} // namespace brenix
