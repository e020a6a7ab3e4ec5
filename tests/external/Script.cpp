// How the stand-in answers.
#include "scripted/ChannelFixture.hpp"

namespace
{

const bool scriptIsSet = [] {
    scripted::core.number = 42;
    scripted::core.on["Channel"] = [] {
        if (scripted::core.log.back().starts_with("Channel(missing")) {
            throw brenixcore::CouldNotLoadDevice("It is missing.");
        }
    };
    scripted::core.on["open"] = [] { throw std::runtime_error("The stand-in does not open."); };
    return true;
}();

} // namespace
