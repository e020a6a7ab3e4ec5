// What a device has told of its losses, in sentences.
#ifndef BRENIX_PLUGINS_TOLD_HPP
#define BRENIX_PLUGINS_TOLD_HPP

#include "brenixcore/plugin/Plugin.hpp"

#include <array>
#include <string>

namespace bytes
{

/// An error takes the place of one that nobody has read yet: hence each also says what others said.
class Told
{
public:
    enum Loss { wrongType, silence, damage };

    explicit Told(brenixcore::plugin::DeviceHost& deviceHost) : host(deviceHost) {}

    /// Raises an error of a sentence, which replaces the last one on this loss.
    void raise(Loss loss, const char* identifier, const std::string& sentence)
    {
        sentences.at(loss).clear();
        host.raise("error", identifier, (sentence + besides()).c_str());
        sentences.at(loss) = ' ' + sentence;
    }

    /// The last sentence on each loss, each behind a space.
    std::string besides() const { return sentences[0] + sentences[1] + sentences[2]; }

private:
    brenixcore::plugin::DeviceHost& host;
    std::array<std::string, 3> sentences;
};

} // namespace bytes

#endif
