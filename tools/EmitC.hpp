// What the writers of C programs have in common: texts with @NAMES@ in them, and their values.
#ifndef BRENIX_TOOLS_EMITC_HPP
#define BRENIX_TOOLS_EMITC_HPP

#include "Commands.hpp"

#include <cstddef>
#include <map>
#include <string>
#include <string_view>

namespace brenix
{

using Values = std::map<std::string, std::string>;

/// Puts values in the place of @NAMES@, nothing where there is none.
std::string fill(std::string_view text, const Values& values);

/// A string literal.
std::string quote(std::string_view text);

/// A double constant.
std::string constant(double value);

bool isFloating(const ElementType& type);

/// A statement that prints an element.
std::string printElement(const ElementType& type, const std::string& file,
                         const std::string& element);

/// What all programs have.
Values commonValues(const Settings& settings, bool opens, bool output);

/// How a program opens its file, a sound file as the text in C for its SF_INFO has it.
void addFile(const Settings& settings, bool writes, const std::string& info, Values& values);

/// Writes a program.
void save(const Settings& settings, std::string_view program, Values values);

/// The same for one with a file, which is ended when it has moved so much. It needs no main().
void saveTransfer(const Settings& settings, std::string_view program, double mostCounts,
                  double mostSeconds, Values values);

} // namespace brenix

#endif
