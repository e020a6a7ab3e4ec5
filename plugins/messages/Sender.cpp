#include "Sender.hpp"

#include "Texts.hpp"

#include <unistd.h>

#include <array>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <random>

namespace messages
{

namespace
{

std::string nameOfMachine()
{
    std::array<char, 65> name{};
    return ::gethostname(name.data(), name.size() - 1) == 0 && name[0] != '\0' ? name.data()
                                                                               : "writer";
}

} // namespace

Sender::Sender(brenixcore::plugin::Options& options)
{
    using brenixcore::plugin::Options;
    const auto text = [&](const char* name, const std::string& value, std::size_t least) {
        std::string given = options.text(name).value_or(value);
        if (given.size() < least || given.size() > 200 || !isUtf8(given)) {
            Options::fail(name, "must be UTF-8 of " + std::to_string(least) + " to 200 bytes");
        }
        return given;
    };
    description.name = text("Name", nameOfMachine(), 1);
    description.unit = text("Unit", "", 0);
    description.rate = options.number("Rate").value_or(0);
    if (!isRate(description.rate)) {
        Options::fail("Rate", "must be 0 or from 1e-6 to 1e15");
    }
}

void Sender::describe(const std::string& option, const std::string& value)
{
    if (isUtf8(value)) {
        description.options[option] = value;
    }
}

void Sender::begin()
{
    std::random_device random; // the system's
    std::array<char, 17> digits{};
    std::snprintf(digits.data(), digits.size(), "%08x%08x", random(), random());
    description.stream = description.name + "/" + digits.data();
    description.seq = description.first = lost = 0;
}

void Sender::number(Data& data, std::uint64_t begin, std::uint64_t counts) const
{
    using namespace std::chrono;
    brenixcore::plugin::Packet& packet = data.packet;
    if (packet.time == 0) {
        packet.time = duration_cast<nanoseconds>(system_clock::now().time_since_epoch()).count();
    } else if (begin > data.begin) {
        const double period = packet.period != 0     ? packet.period
                              : description.rate > 0 ? 1e9 / description.rate
                                                     : 0;
        packet.time += std::llround(period * static_cast<double>(begin - data.begin));
    }
    packet.lost = lost;
    data.stream = description.stream;
    data.seq = description.seq;
    data.first = description.first + lost;
    data.begin = begin;
    data.counts = counts;
}

void Sender::sent(const Data& data)
{
    ++description.seq;
    description.first = data.first + data.counts;
    lost = 0;
}

void Sender::lose(std::uint64_t counts)
{
    lost += counts;
}

} // namespace messages
