// What the commands have to do with the terminal.

#include "Commands.hpp"
#include "Screen.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
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
    if (::fcntl(STDIN_FILENO, F_GETFD) ==
        -1) { // closed: else the handler takes a file that is there
        ::open("/dev/null", O_RDONLY);
    }
    struct sigaction action {
    };
    action.sa_handler = [](int /*signal*/) {
        interrupted = interrupted + 1;
        if (interrupted == 3) { // the order is taking too long
            leaveScreen();
            _exit(Interrupted);
        }
        const int nothing = ::open("/dev/null", O_RDONLY); // a read that waits comes to its end
        ::dup2(nothing, STDIN_FILENO);
        ::close(nothing);
    };
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
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
