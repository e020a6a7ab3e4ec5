// Device `serial`: a serial port, 8 data bits. What arrives goes into the input stream, and what is
// written is sent.

#include "ByteDevice.hpp"

#include <termios.h>

namespace
{

using namespace bytes;
using Base = asio::serial_port_base;

class Serial : public ByteDevice<asio::serial_port>
{
public:
    Serial() : ByteDevice(Framing::None) {}

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& /*properties*/,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        peer = options.text("Port").value_or("");
        if (peer.empty()) {
            Options::fail("Port", "must name a serial port");
        }
        baudRate =
            static_cast<unsigned int>(options.wholeNumber("BaudRate", 1, 4000000).value_or(9600));
        constexpr std::array parities = {Base::parity::none, Base::parity::even, Base::parity::odd};
        parity = parities.at(readChoice<3>(options, "Parity", {"none", "even", "odd"}));
        stopBits = options.wholeNumber("StopBits", 1, 2).value_or(1) == 1 ? Base::stop_bits::one
                                                                          : Base::stop_bits::two;
        constexpr std::array controls = {Base::flow_control::none, Base::flow_control::software,
                                         Base::flow_control::hardware};
        flowControl =
            controls.at(readChoice<3>(options, "FlowControl", {"none", "software", "hardware"}));
        readOptions(options);
        options.requireAllKnown();
        host = &deviceHost;
        source = peer;
        return {StreamInfo{}, StreamInfo{}};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        asio::error_code error;
        port.open(peer, error);
        if (error) {
            throw std::runtime_error("Could not open " + peer + ": " + error.message());
        }
        set("BaudRate", Base::baud_rate(baudRate));
        set("Parity", Base::parity(parity));
        set("StopBits", Base::stop_bits(stopBits));
        set("FlowControl", Base::flow_control(flowControl));
    }

    void close() override
    {
        asio::error_code ignored;
        port.close(ignored);
    }

private:
    template <typename Setting>
    void set(const std::string& option, const Setting& setting)
    {
        asio::error_code error;
        port.set_option(setting, error);
        if (error) {
            const std::string problem = "is not possible for " + peer + ": " + error.message();
            close();
            Options::fail(option, problem);
        }
    }

    /// Or else closing would wait for it.
    void abandonOutput() override { ::tcflush(port.native_handle(), TCOFLUSH); }

    unsigned int baudRate = 9600;
    Base::parity::type parity = Base::parity::none;
    Base::stop_bits::type stopBits = Base::stop_bits::one;
    Base::flow_control::type flowControl = Base::flow_control::none;
};

constexpr OptionInfo optionTable[] = {
    {"Port", "text", "", "(required)", "such as /dev/ttyUSB0"},
    {"BaudRate", "whole number", "baud", "9600", "one that the system knows"},
    {"Parity", "text", "", "none", "none, even or odd"},
    {"StopBits", "whole number", "", "1", "1 or 2"},
    {"FlowControl", "text", "", "none",
     "none, software (XON and XOFF, which then cannot be data) or hardware (RTS and CTS)"},
    elementTypeOption,
    byteOrderOption,
    blockSizeOption,
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Serial)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
