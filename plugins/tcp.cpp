// Device `tcp`: a TCP client. What arrives goes into the input stream, and what is written is sent.

#include "ByteDevice.hpp"

namespace
{

using namespace bytes;
using asio::ip::tcp;

class Tcp : public ByteDevice<tcp::socket>
{
public:
    Tcp() : ByteDevice(Framing::None) {}

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& /*properties*/,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        hostName = options.text("Host").value_or("");
        if (hostName.empty()) {
            Options::fail("Host", "must name a host");
        }
        const auto number = options.wholeNumber("Port", 1, 65535);
        if (!number) {
            Options::fail("Port", "is required");
        }
        portNumber = std::to_string(*number);
        const double seconds = options.number("ConnectTimeout").value_or(10);
        if (!(seconds > 0 && seconds <= 86400)) {
            Options::fail("ConnectTimeout", "must be more than 0 and at most 86400 seconds");
        }
        timeout = std::chrono::duration_cast<std::chrono::steady_clock::duration>(
            std::chrono::duration<double>(seconds));
        endsWithInput = readChoice<2>(options, "HalfClose", {"keep", "end"}) == 1;
        readOptions(options);
        options.requireAllKnown();
        host = &deviceHost;
        source = peer = hostName + ":" + portNumber;
        return {StreamInfo{}, StreamInfo{}};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        if (const asio::error_code error = connect()) {
            close();
            throw std::runtime_error("Could not connect to " + peer + ": " + error.message());
        }
        port.set_option(tcp::no_delay(true));
    }

    void close() override
    {
        asio::error_code ignored;
        port.close(ignored);
    }

private:
    asio::error_code connect()
    {
        asio::error_code error;
        const auto endpoints = tcp::resolver(context).resolve(hostName, portNumber, error);
        if (error) {
            return error;
        }
        asio::async_connect(
            port, endpoints,
            [&](const asio::error_code& result, const tcp::endpoint&) { error = result; });
        context.restart();
        context.run_for(timeout);
        if (!context.stopped()) {
            close();
            context.run();
            return asio::error::timed_out;
        }
        return error;
    }

    /// Closing with input that nobody took resets the connection, at which the other side may throw
    /// away what it has not looked at yet: hence it is to end first.
    bool endOutput() override
    {
        asio::error_code ignored; // the other side may have closed
        port.shutdown(tcp::socket::shutdown_send, ignored);
        return true;
    }

    /// Closing then resets the connection: the other side must not take the data for complete.
    void abandonOutput() override
    {
        asio::error_code ignored;
        port.set_option(asio::socket_base::linger(true, 0), ignored);
    }

    std::string hostName;
    std::string portNumber;
    std::chrono::steady_clock::duration timeout{};
};

constexpr OptionInfo optionTable[] = {
    {"Host", "text", "", "(required)", "name or address"},
    {"Port", "whole number", "", "(required)", "1 to 65535"},
    elementTypeOption,
    byteOrderOption,
    blockSizeOption,
    {"HalfClose", "text", "", "keep",
     "when the other side ends its output: keep sends on until it refuses, end sends what is "
     "queued and is done"},
    {"ConnectTimeout", "number", "seconds", "10",
     "for the connection, up to 86400; the system's look-up of the name is apart"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Tcp)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_FIELDS(elementFields, elementFields)
