// Device `zmq`: packets to and from other machines over ZeroMQ.

#include "zmq/Endpoint.hpp"
#include "zmq/Keys.hpp"
#include "zmq/Reading.hpp"
#include "zmq/Writing.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <array>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <utility>

namespace
{

using namespace brenixcore::plugin;
using namespace zeromq;
using brenixplugin::PropertyMap;

constexpr std::array patternNames = {"push", "pull", "publish", "subscribe"};

const char* nameOf(Pattern pattern)
{
    return patternNames.at(static_cast<std::size_t>(pattern));
}

Pattern readPattern(Options& options)
{
    const auto name = options.text("Pattern");
    if (!name) {
        Options::fail("Pattern", "is required");
    }
    const auto* const found = std::find(patternNames.begin(), patternNames.end(), *name);
    if (found == patternNames.end()) {
        Options::fail("Pattern", "must be push, pull, publish or subscribe, not " + *name);
    }
    return static_cast<Pattern>(found - patternNames.begin());
}

/// Refuses options that mean nothing here.
void refuse(const PropertyMap& options, std::initializer_list<const char*> names,
            const std::string& reason)
{
    for (const char* const name : names) {
        if (options.contains(name)) {
            Options::fail(name, reason);
        }
    }
}

void refuseOthers(const PropertyMap& options, Pattern pattern)
{
    const std::string notFor = std::string("is not for ") + nameOf(pattern);
    if (writes(pattern)) {
        refuse(options, {"MaxMessage", "Writers"}, notFor + ", which writes");
    } else {
        refuse(options, {"Readers", "CloseTimeout", "Name", "Unit", "Rate"},
               notFor + ", which reads");
    }
    if (pattern == Pattern::Push || pattern == Pattern::Pull) {
        refuse(options, {"Topic"}, notFor + ": publish and subscribe have topics");
    }
    if (pattern != Pattern::Pull) {
        refuse(options, {"Share"}, notFor + ": readers share what pull takes");
    }
}

void readKeyFiles(Options& options, Settings& settings)
{
    const auto read = [&](const char* name, bool isOfSide) {
        const auto file = options.text(name);
        if (!file && isOfSide && !settings.secretKeyFile.empty()) {
            Options::fail(name, settings.binds ? "is required: who may come in to a side that binds"
                                               : "is required: the key of the side that binds");
        }
        if (file && !isOfSide) {
            Options::fail(name, settings.binds ? "is not for a side that binds"
                                               : "is for the side that binds");
        }
        if (file && settings.secretKeyFile.empty()) {
            Options::fail(name, "needs SecretKeyFile");
        }
        return file.value_or("");
    };
    settings.secretKeyFile = options.text("SecretKeyFile").value_or("");
    settings.serverKeyFile = read("ServerKeyFile", !settings.binds);
    settings.allowedKeysFile = read("AllowedKeysFile", settings.binds);
}

class Zmq : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        host = &deviceHost;
        settings = {};
        writing = {};
        sender.reset();
        receiver.reset();
        settings.endpoint = options.text("Endpoint").value_or("");
        settings.pattern = readPattern(options);
        settings.binds = options.logical("Bind").value_or(writes(settings.pattern));
        checkEndpoint(settings.endpoint, settings.binds);
        refuseOthers(optionMap, settings.pattern);
        settings.topic = options.text("Topic").value_or("");
        settings.highWater =
            static_cast<int>(options.wholeNumber("HighWater", 1, 1L << 30).value_or(1000));
        readKeyFiles(options, settings);
        if (writes(settings.pattern)) {
            initWriter(options);
        } else {
            receiver.emplace(options, properties, deviceHost);
            receiver->shares = options.logical("Share").value_or(false);
            settings.maxMessage = receiver->getMaxMessage();
        }
        options.requireAllKnown();
        publish(properties, "Endpoint", settings.endpoint);
        publish(properties, "Peers", 0U);
        publish(properties, "PublicKey", std::string());
        return {writes(settings.pattern) ? std::nullopt : std::optional(StreamInfo{}),
                writes(settings.pattern) ? std::optional(StreamInfo{}) : std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        link = std::make_unique<Link>(settings, *host);
        host->updateProperty(makeScalar("Endpoint", link->getEndpoint()));
        host->updateProperty(makeScalar("PublicKey", link->getPublicKey()));
        host->updateProperty(makeScalar("Peers", 0U));
    }

    void run(DeviceStreams& streams) override
    {
        const std::unique_ptr<Link> own = std::move(link); // closed when this ends
        if (sender) {
            Writing(*own, settings, writing, *sender, wakeUp, *host, outstanding).run(streams);
        } else {
            Reading(*own, settings, *receiver, wakeUp).run(streams);
        }
    }

    void wake() noexcept override { wakeUp.signal(); }

    /// Command `keys`: makes two files, of a secret key and of its public one.
    void execute(const std::string& command, const PropertyMap& optionMap) override
    {
        if (command != "keys") {
            Device::execute(command, optionMap);
        }
        Options options(optionMap);
        const std::string name = options.text("FileName").value_or("");
        options.requireAllKnown();
        if (name.empty()) {
            Options::fail("FileName", "is required");
        }
        host->updateProperty(makeScalar("PublicKey", makeKeys(name).publicKey));
    }

    void close() override { link.reset(); }

private:
    void initWriter(Options& options)
    {
        sender.emplace(options);
        sender->describe("Endpoint", settings.endpoint);
        sender->describe("Pattern", nameOf(settings.pattern));
        sender->describe("Topic", settings.topic);
        writing.readers =
            static_cast<std::uint64_t>(options.wholeNumber("Readers", 0, 65535).value_or(0));
        const double seconds = options.number("CloseTimeout").value_or(10);
        if (!(seconds >= 0 && seconds <= 86400)) {
            Options::fail("CloseTimeout", "must be from 0 to 86400 seconds");
        }
        writing.closeTimeout =
            std::chrono::ceil<std::chrono::milliseconds>(std::chrono::duration<double>(seconds));
    }

    DeviceHost* host = nullptr;
    Settings settings;
    WritingSettings writing;
    std::optional<messages::Sender> sender;
    std::optional<messages::Receiver> receiver;
    WakeUp wakeUp;
    Outstanding outstanding{0, 0, false, wakeUp}; ///< outlives the link
    std::unique_ptr<Link> link;
};

constexpr OptionInfo optionTable[] = {
    {"Endpoint", "text", "", "(required)",
     "tcp://address:port or ipc://file; * as port lets the system choose one"},
    {"Pattern", "text", "", "(required)",
     "push and pull: each packet to one reader, and a slow one holds the writer back; publish and "
     "subscribe: each packet to all readers, and a slow one loses"},
    {"Bind", "logical", "", "by Pattern",
     "whether it waits at the endpoint or goes there; push and publish wait"},
    {"Topic", "text", "", "",
     "publish: stands before each packet; subscribe: how the topic of those begins that it wants"},
    {"HighWater", "whole number", "packets", "1000",
     "that are kept for each reader, and again by each reader"},
    {"Readers", "whole number", "", "0",
     "writing: nothing is sent until so many are there; of publish, they have subscribed"},
    {"CloseTimeout", "number", "seconds", "10",
     "writing: how long close goes on handing over, up to 86400"},
    {"Share", "logical", "", "0",
     "pull: others take packets of the same writers, so what is missing is no loss"},
    {"SecretKeyFile", "text", "", "none", "the key of this side, as brenix keys makes it"},
    {"ServerKeyFile", "text", "", "none",
     "of the side that goes to the endpoint: the public key of the one that waits there"},
    {"AllowedKeysFile", "text", "", "none",
     "of the side that waits at the endpoint: the public keys that may come in, one a line"},
    messages::senderOptions[0],
    messages::senderOptions[1],
    messages::senderOptions[2],
    messages::receiverOptions[0],
    messages::receiverOptions[1],
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"Endpoint", "char", "", "where it is bound, with the port that the system chose"},
    {"Peers", "uint32", "", "that are connected and were let in"},
    {"PublicKey", "char", "", "of SecretKeyFile, or of the pair that keys made"},
    messages::receiverProperties[0],
    messages::receiverProperties[1],
    messages::receiverProperties[2],
    messages::receiverProperties[3],
    {},
};

constexpr OptionInfo keysOptions[] = {
    {"FileName", "text", "", "(required)", "of the secret key; .pub is added for the public one"},
    {},
};

constexpr CommandInfo commandTable[] = {
    {"keys", keysOptions, "makes a pair of keys; the files must not be there"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Zmq)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(messages::messageFields, messages::messageFields)
BRENIXCORE_DESCRIBE_COMMANDS(commandTable)
