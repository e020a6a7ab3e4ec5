// What the writers of C programs have in common: templates, which are C with tags, and what goes into them.
#ifndef BRENIX_TOOLS_EMITC_HPP
#define BRENIX_TOOLS_EMITC_HPP

#include "commands/Commands.hpp"

#include <kainjow/mustache.hpp>

#include <string>
#include <string_view>

namespace brenix
{

using kainjow::mustache::list;
using kainjow::mustache::object;
using Data = kainjow::mustache::data;

/// A string literal.
std::string quote(std::string_view text);

/// A double constant.
std::string constant(double value);

/// A list initialiser.
std::string initialiser(const ElementType& type, const Bytes& elements);

/// A text inside of a comment.
std::string commentOf(std::string_view text);

} // namespace brenix

#endif
