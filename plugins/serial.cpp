// Device `serial`: a serial port, 8 data bits. What arrives goes into the input stream, and what is
// written is sent.

#include "ByteDevice.hpp"
#include "SerialPorts.hpp"

#include <linux/serial.h>
#include <sys/ioctl.h>
#include <termios.h>

#include <array>
#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

namespace
{

using namespace bytes;
using Base = asio::serial_port_base;

/// What goes wrong on a line, in the order in which it is counted.
struct LineError {
    const char* property;
    const char* name;
};
constexpr std::array lineErrors = {
    LineError{"Overruns", " overruns"}, LineError{"FramingErrors", " framing errors"},
    LineError{"ParityErrors", " parity errors"}, LineError{"Breaks", " breaks"}};

class Serial : public ByteDevice<asio::serial_port>
{
public:
    Serial() : ByteDevice(Framing::None) {}

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
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
        counts = {};
        for (const LineError& error : lineErrors) {
            publish(properties, error.property, std::uint64_t{0});
        }
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
        const auto first = systemCounts();
        losesUnseen = first.has_value();
        counted = first.value_or(SystemCounts{});
        for (std::size_t i = 0; i < lineErrors.size(); ++i) {
            setCount(i, 0);
        }
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

    using SystemCounts = std::array<std::uint32_t, lineErrors.size()>;

    /// As the system counts, modulo 2^32. Nothing where it does not, as for pseudo-terminals.
    std::optional<SystemCounts> systemCounts()
    {
        serial_icounter_struct line{};
        if (::ioctl(port.native_handle(), TIOCGICOUNT, &line) != 0) {
            return std::nullopt;
        }
        const auto number = [](int count) { return static_cast<std::uint32_t>(count); };
        return SystemCounts{number(line.overrun) + number(line.buf_overrun), number(line.frame),
                            number(line.parity), number(line.brk)};
    }

    void setCount(std::size_t which, std::uint64_t count)
    {
        if (counts.at(which) != count) {
            counts.at(which) = count;
            host->updateProperty(makeScalar(lineErrors.at(which).property, count));
        }
    }

    std::string lostBefore() override
    {
        std::string all;
        const SystemCounts now = systemCounts().value_or(counted);
        for (std::size_t i = 0; i < lineErrors.size(); ++i) {
            setCount(i, counts.at(i) + (now.at(i) - counted.at(i)));
            if (counts.at(i) > 0) {
                all.append(all.empty() ? "" : ", ").append(std::to_string(counts.at(i)));
                all.append(lineErrors.at(i).name);
            }
        }
        counted = now;
        return all.empty() ? all : "Line " + peer + " had " + all + ".";
    }

    /// Or else closing would wait for it.
    void abandonOutput() override { ::tcflush(port.native_handle(), TCOFLUSH); }

    unsigned int baudRate = 9600;
    Base::parity::type parity = Base::parity::none;
    Base::stop_bits::type stopBits = Base::stop_bits::one;
    Base::flow_control::type flowControl = Base::flow_control::none;
    SystemCounts counted{};                                ///< so far
    std::array<std::uint64_t, lineErrors.size()> counts{}; ///< since open
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

constexpr PropertyInfo propertyTable[] = {
    {"Overruns", "uint64", "", "since open: times that bytes were lost for want of room"},
    {"FramingErrors", "uint64", "", "since open: bytes that had no stop bit"},
    {"ParityErrors", "uint64", "", "since open: bytes of the other parity"},
    {"Breaks", "uint64", "", "since open"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Serial)
BRENIXCORE_EXPORT_FIND(serial::findPorts)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(elementFields, elementFields)
