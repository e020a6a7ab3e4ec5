// What the commands have to do with the terminal.
#ifndef BRENIX_TOOLS_TERMINAL_HPP
#define BRENIX_TOOLS_TERMINAL_HPP

#include <chrono>

namespace brenix
{

/// From here on SIGINT or SIGTERM ends what is under way in good order, the third one at once.
void catchInterrupts();
bool isInterrupted();

/// Until more may have come.
void pauseShortly();

double secondsSince(std::chrono::steady_clock::time_point start);

struct TerminalSize {
    int columns = 80;
    int rows = 24;
};
TerminalSize terminalSize();

/// A line on a terminal's standard error: how far it is, the rate and the time that remains.
class Progress
{
public:
    /// A total that is not known is 0 or infinity.
    Progress(double totalCounts, bool quiet);
    void update(double counts);

    /// Clears the line.
    void finish() const;

private:
    double total;
    bool shown;
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    std::chrono::steady_clock::time_point drawn = start;
};

} // namespace brenix

#endif
