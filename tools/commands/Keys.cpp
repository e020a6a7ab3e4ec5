// The command keys. The device makes them, so that this program needs no library for it.

#include "commands/Commands.hpp"

#include <iostream>

namespace brenix
{

ExitCode makeKeys(const Settings& settings)
{
    ChannelSettings device;
    device.device = "zmq";
    device.options = {"Endpoint=tcp://127.0.0.1:*", "Pattern=push"}; // which it does not open
    Channel channel(device, Use::Look);
    channel.execute("keys", {"FileName:char=" + settings.keyFile});
    const ElementType& text = elementType("char");
    const std::string key =
        printElements(text, channel.property("PublicKey", text).value_or(Bytes()));
    if (settings.json) {
        printJson(std::cout, {{"secretKeyFile", settings.keyFile},
                              {"publicKeyFile", settings.keyFile + ".pub"},
                              {"publicKey", key}});
    } else {
        std::cout << key << '\n';
    }
    return Success;
}

} // namespace brenix
