// What a device that moves bytes has lost, and how it says so.
#ifndef BRENIX_PLUGINS_LOSSES_HPP
#define BRENIX_PLUGINS_LOSSES_HPP

#include "brenixcore/plugin/Plugin.hpp"

#include <cstdint>
#include <string>
#include <string_view>

namespace bytes
{

/// All sums are of one run. An error takes the place of one that nobody has read yet: hence each tells
/// all that is lost.
class Losses
{
public:
    /// `sink` is where output goes and `source` where input comes from, by their names.
    Losses(brenixcore::plugin::DeviceHost& deviceHost, const std::string& sinkName,
           const std::string& sourceName, std::string_view typeName)
        : type(typeName), host(deviceHost), sink(sinkName), source(sourceName)
    {
    }

    void addUnsent(std::uint64_t length, const std::string& why)
    {
        if (length > 0) {
            unsent += length;
            reason = why;
        }
    }

    /// Raises an error if more is lost than was told.
    void tell()
    {
        if (text() != told) {
            raise("brenix:Device:dataLost", "");
        }
    }

    /// Raises an error that says something more.
    void raise(const char* identifier, const std::string& what)
    {
        told = text();
        host.raise("error", identifier, with(what).c_str());
    }

    /// A sentence, followed by one for each kind of loss.
    std::string with(const std::string& what) const
    {
        const std::string all = text();
        return what + (what.empty() || all.empty() ? "" : " ") + all;
    }

    const std::string_view type; ///< of the elements
    std::string before; ///< what was lost before the device could take it: a sentence, or empty
    std::uint64_t wrongType = 0; ///< elements that were not sent
    std::uint64_t noRoom = 0;    ///< elements that arrived
    std::uint64_t partial = 0;   ///< bytes that arrived, of elements that have no end

private:
    std::string text() const
    {
        std::string all = before;
        const auto add = [&](std::uint64_t number, const std::string& sentence) {
            if (number > 0) {
                all.append(all.empty() ? "" : " ").append(std::to_string(number));
                all.append(sentence).append(".");
            }
        };
        add(unsent, " bytes were not sent to " + sink + (reason.empty() ? "" : ": " + reason));
        add(wrongType, " elements of another type were not sent to " + sink);
        add(noRoom, " elements from " + source + " found no room while the channel closed");
        add(partial, " bytes from " + source + " are no whole " + std::string(type));
        return all;
    }

    brenixcore::plugin::DeviceHost& host;
    const std::string& sink;
    const std::string& source;
    std::uint64_t unsent = 0; ///< bytes
    std::string reason;       ///< of the last of them; empty when it is told elsewhere
    std::string told;
};

} // namespace bytes

#endif
