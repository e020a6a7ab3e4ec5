// What is shown on a terminal: text that does it no harm, and pictures that are drawn one over the other.
#ifndef BRENIX_TOOLS_SCREEN_HPP
#define BRENIX_TOOLS_SCREEN_HPP

#include <string>
#include <string_view>

namespace brenix
{

/// A text without control characters, but for newlines, and without what is not UTF-8: these bytes become
/// such as \\x1b.
std::string printable(std::string_view text);

/// Of the standard output's terminal, or what fits elsewhere.
struct Size {
    int columns = 80;
    int rows = 24;
};
Size terminalSize();

/// While it lives, the standard output's terminal shows its pictures alone, and what is typed is not
/// echoed. A suspension or a signal that ends the process leaves the terminal as it was, too.
class Screen
{
public:
    Screen();
    Screen(const Screen&) = delete;
    Screen& operator=(const Screen&) = delete;
    ~Screen();

    /// Draws in the place of the last picture. Lines that are too long are cut off.
    static void show(const std::string& picture);

    /// Whether the key was typed since the last question.
    static bool isTyped(char key);
};

/// What the destructor does; a signal handler may call it at any time.
void leaveScreen() noexcept;

} // namespace brenix

#endif
