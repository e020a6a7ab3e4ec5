// Options on the command line: of a channel, and of its filters.
#ifndef BRENIX_TOOLS_OPTIONS_HPP
#define BRENIX_TOOLS_OPTIONS_HPP

#include "Values.hpp"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace brenix
{

/// What an option list of a command line can have at most.
constexpr std::size_t maxOptions = 16;

/// An option of a channel, as coder.h takes it.
struct Option {
    std::string name;
    const ElementType* type;
    int count;
    Bytes elements;
};

/// Reads a number, which may have a prefix of SI behind it, n to T, or Ki, Mi or Gi. Returns whether it is
/// one.
bool parseQuantity(std::string_view text, double& value);

/// Reads options "Name:type=value,value..." of a plug-in; its name is empty when nothing describes them.
/// Without a type a text is "char" and a number, with a prefix or without, "double", as the plug-in
/// describes the option; if it does not, what is no number is "char". Throws std::invalid_argument.
std::vector<Option> parseOptions(const std::vector<std::string>& texts, const std::string& plugin);

struct FilterSettings {
    std::string name;
    std::vector<Option> options;
};

/// Reads a plug-in and its options, with spaces between them.
FilterSettings parseFilter(const std::string& text);

} // namespace brenix

#endif
