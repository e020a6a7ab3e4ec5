// Writes C programs that do what a command just did.
#ifndef BRENIX_TOOLS_EMITC_HPP
#define BRENIX_TOOLS_EMITC_HPP

#include "Channel.hpp"
#include "Samples.hpp"

#include <string>
#include <vector>

namespace brenix
{

struct Settings;

struct PropertyValue {
    std::string name;
    std::string unit;
    const ElementType* type;
    Bytes elements;
};

// Each writes settings.emitC, and throws a Failure when it cannot.

void emitInfo(const Settings& settings, const std::vector<PropertyValue>& properties);
void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds);
void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds);

} // namespace brenix

#endif
