// Random devices and callers: what was read, lost and flushed and what still waits is together what the
// device delivered, in every mode, whenever the device rests.

#include "Handed.hpp"
#include "Soak.hpp"

#include <numeric>
#include <thread>

using namespace handed;

namespace
{

constexpr std::int64_t epoch = 1'700'000'000'000'000'000;
constexpr std::int64_t period = 1000; // nanoseconds of a count

class Sequence
{
public:
    explicit Sequence(std::uint64_t seed) : random(seed), deviceRandom(seed + 1)
    {
        limit = anyOf<std::uint64_t>({0, 1, 3, 10, 10, 50, UINT64_MAX});
        DeviceInfo info{StreamInfo{1, 1e9 / period}, std::nullopt};
        if (pick(3) == 0) {
            info.output = StreamInfo{}; // then close drains
        }
        rig.emplace(info, limit, new Picky(*this));
        device = rig->device;
    }

    /// Returns how many steps there were.
    std::uint64_t run()
    {
        using S = Sequence;
        constexpr void (Sequence::*open[])() = {&S::readSome, &S::readSome, &S::readSome,
                                                &S::readSome, &S::check,    &S::discard,
                                                &S::flush,    &S::close};
        constexpr void (Sequence::*closed[])() = {&S::reopen,   &S::reopen,  &S::readSome,
                                                  &S::readSome, &S::discard, &S::init};
        init();
        std::uint64_t steps = 0;
        for (; steps < 100 && !testing::Test::HasFailure(); ++steps) {
            const bool isOpen = rig->channel.isOpen();
            const std::size_t step = pick(isOpen ? std::size(open) : std::size(closed));
            SCOPED_TRACE("step " + std::to_string(steps) + (isOpen ? ", open " : ", closed ") +
                         std::to_string(step));
            (this->*(isOpen ? open : closed)[step])();
        }
        return steps;
    }

private:
    std::size_t pick(std::size_t count) { return random() % count; }
    template <typename T>
    T anyOf(std::initializer_list<T> values)
    {
        return values.begin()[pick(values.size())];
    }

    // --- The device's thread ---

    std::size_t devicePick(std::size_t count) { return deviceRandom() % count; }
    std::uint64_t valueOf(std::uint64_t index) const { return opening << 32 | index; }

    void produce(DeviceStreams& streams)
    {
        deviceStreams = &streams;
        while (!resting && !streams.isClosing() && budget > 0) {
            switch (devicePick(8)) {
            case 0: {
                const std::uint64_t lost = devicePick(4);
                next += lost;
                const bool isCountedOnly = lost == 1;
                toldOtherwise += isCountedOnly ? lost : 0;
                streams.tellLost(lost, isCountedOnly ? nullptr : lost == 2 ? "told" : "");
                break;
            }
            case 1:
                std::this_thread::sleep_for(std::chrono::microseconds(devicePick(100)));
                break;
            case 2: {
                const std::uint64_t taken = streams.takenCounts();
                EXPECT_LE(taken, next);
                EXPECT_GE(valueOf(taken), position);
                position = valueOf(taken);
                break;
            }
            case 3:
                if (devicePick(20) == 0) {
                    throw std::runtime_error("the end");
                }
                break;
            default:
                --budget;
                bring(streams);
            }
        }
        if (streams.isClosing()) {
            bring(streams); // which is refused, or has room while the output drains
        }
    }

    void bring(DeviceStreams& streams)
    {
        Packet packet;
        packet.lost = devicePick(4) == 0 ? devicePick(9) : 0;
        const std::uint64_t first = next + packet.lost;
        number(packet, valueOf(first), 1 + devicePick(devicePick(8) == 0 ? 60 : 6));
        const std::uint64_t end = first + packet.counts;
        packet.time = devicePick(3) == 0 ? 0 : epoch + static_cast<std::int64_t>(first) * period;
        bool isTaken = false;
        if (limit > 0 && devicePick(2) == 0) {
            isInPush = true;
            isTaken = streams.push(std::move(packet));
            isInPush = false;
            if (!isTaken) { // but the gap before it counts
                next = first;
            }
        } else {
            isTaken = tryUntilRest(streams, packet);
        }
        if (isTaken && !isMixed) {
            next = end;
        }
    }

    bool tryUntilRest(DeviceStreams& streams, Packet& packet)
    {
        for (;;) {
            const unsigned wakes = device->wakes;
            if (streams.tryPush(packet)) {
                return true;
            }
            if (streams.isClosing()) {
                return false;
            }
            device->await([&] { return device->wakes != wakes || resting; });
            if (device->wakes == wakes) { // it is to rest, and room it would have been told
                EXPECT_FALSE(streams.tryPush(packet));
                return false;
            }
        }
    }

    /// Drops, thins out, doubles or refuses packets, and numbers what is left.
    struct Mixer : Filter {
        explicit Mixer(Sequence& sequence) : s(sequence) {}
        void tune(Options& /*options*/) override {}
        void apply(Packet& packet) override
        {
            const std::uint64_t brought = packet.counts;
            const std::uint64_t mixed[] = {0, (brought + 1) / 2, brought * 2, brought, brought};
            const std::size_t way = s.devicePick(6);
            s.next += packet.lost;
            const std::int64_t time = packet.time;
            packet = Packet(); // what was lost before it, the core knows
            if (way == 5) {
                s.next += brought;
                s.toldOtherwise += brought;
                throw std::runtime_error("refused");
            }
            number(packet, s.valueOf(s.next), mixed[way]);
            packet.time = mixed[way] == brought ? time : 0;
            s.next += mixed[way];
        }
        Sequence& s;
    };

    // --- The caller's thread ---

    /// Refuses packets, and forges their counts.
    struct Picky : Identity {
        explicit Picky(Sequence& sequence) : s(sequence) {}
        void convertInput(Packet& packet) override
        {
            EXPECT_EQ(packet.fields->count("Seen"), 0);
            setField(packet, makeScalar("Seen", true));
            const std::size_t way = s.pick(30);
            if (way < 3) {
                s.toldOtherwise += packet.counts;
                packet.counts += way;
                if (way < 2) {
                    throw std::runtime_error("refused");
                }
            }
        }
        Sequence& s;
    };

    std::string anyOverflow() { return anyOf({"wait", "dropOldest", "dropNewest"}); }

    void init()
    {
        overflow = anyOverflow();
        rig->log.forgetLostCounts();
        rig->init(Rig::options(overflow, true));
        isMixed = pick(3) == 0;
        if (isMixed) {
            rig->addFilter(new Mixer(*this));
        }
        earlier = next = wasRead = flushed = lostEarlier = flushes = 0; // left with the stream
        mayPend = false;
        open("");
    }

    void reopen() { open(pick(2) == 0 ? overflow = anyOverflow() : ""); }

    void open(const std::string& policy)
    {
        earlier += std::exchange(next, 0);
        lostEarlier += rig->log.getLostCounts();
        told = toldOtherwise = 0;
        budget = 60;
        mayPend = mayPend || overflow == "wait";
        position = valueOf(0);
        ++opening;
        rig->open(policy, anyOf({0.0, 0.0005}));
        EXPECT_EQ(rig->log.getLostCounts(), 0);
        resume();
    }

    void close()
    {
        rig->channel.close();
        balance();
        EXPECT_EQ(told + toldOtherwise, rig->log.getLostCounts());
    }

    void resume()
    {
        resting = false;
        device->start([this](DeviceStreams& streams) { produce(streams); });
    }

    void rest()
    {
        resting = true;
        device->notify();
        while (rig->channel.isOpen() && !device->isIdle() && !rig->input->isDeviceDone()) {
            isInPush ? readSome() : std::this_thread::yield();
        }
    }

    void check()
    {
        rest();
        balance();
        resume();
    }

    /// Flushes while the device rests, or is not there.
    void discard()
    {
        rest();
        flushed += balance();
        rig->input->flush();
        EXPECT_EQ(balance(), 0);
        if (rig->channel.isOpen()) {
            resume();
        }
    }

    /// Flushes while the device goes on.
    void flush()
    {
        if (limit > 0) {
            rig->input->flush();
            ++flushes;
        }
    }

    void readSome()
    {
        const std::uint64_t most = std::min<std::uint64_t>(limit, 20);
        read(pick(3) == 0 ? std::min(most, rig->available()) : pick(most + 1));
    }

    void read(std::uint64_t count)
    {
        const std::uint64_t taken = position;
        const Counts listed = rig->peek(count);
        try {
            Counts delivered;
            for (const Buffer& buffer : rig->read(count)) {
                const std::uint64_t first = buffer.data.at(0);
                const std::uint64_t index = first & UINT32_MAX;
                EXPECT_GE(first, least);
                least = first + buffer.data.size();
                EXPECT_TRUE(first >> 32 != taken >> 32 || first >= taken);
                Counts numbers(buffer.data.size());
                std::iota(numbers.begin(), numbers.end(), first);
                EXPECT_EQ(buffer.data, numbers);
                EXPECT_EQ(buffer.index, index);
                if (buffer.time != 0) {
                    EXPECT_EQ(buffer.time, epoch + static_cast<std::int64_t>(index) * period);
                }
                delivered.push_back(buffer.data.size());
            }
            wasRead += count;
            if (std::accumulate(listed.begin(), listed.end(), std::uint64_t{0}) == count) {
                EXPECT_EQ(delivered, listed);
            }
        } catch (const brenixcore::SynchronousInputNotPossible&) {
        } catch (const brenixcore::CouldNotConvertInputData&) {
        }
    }

    std::uint64_t waiting() const
    {
        return earlier + next - wasRead - flushed - lostEarlier - rig->log.getLostCounts();
    }

    /// While the device rests, or is not there. Returns what waits.
    std::uint64_t balance()
    {
        if (flushes > 0) { // what they discarded is known once all else is gone
            while (rig->available() > 0 && !testing::Test::HasFailure()) {
                read(std::min(limit, rig->available()));
            }
            const std::uint64_t discarded = waiting();
            EXPECT_LE(discarded, limit == UINT64_MAX ? 1 << 20 : flushes * (limit + 128));
            flushed += discarded;
            flushes = 0;
        }
        for (const std::string& error : rig->log.takeErrors()) {
            learn(error);
        }
        EXPECT_LE(told + toldOtherwise, rig->log.getLostCounts());
        const Counts listed = rig->peek();
        const std::uint64_t available = rig->available();
        EXPECT_EQ(std::accumulate(listed.begin(), listed.end(), std::uint64_t{0}), available);
        const std::uint64_t beside = waiting() - available;
        mayPend = overflow == "wait" || (mayPend && beside > 0);
        if (beside > 0) { // a packet that has no room
            EXPECT_TRUE(mayPend);
            EXPECT_LE(beside, 120);
            EXPECT_GT(beside, limit - std::min(limit, available));
            EXPECT_TRUE(available > 0 || limit == 0);
        }
        if (available + beside == 0 && rig->channel.isOpen()) {
            EXPECT_EQ(deviceStreams->takenCounts(), next);
        }
        return available + beside;
    }

    void learn(const std::string& error)
    {
        if (const Loss loss = lossOf(error); loss.counts > 0) {
            told += loss.counts;
            EXPECT_GE(loss.sum, told);
            EXPECT_LE(loss.sum, rig->log.getLostCounts());
        } else {
            EXPECT_TRUE(error == "brenix:Stream:filterFailed|refused" ||
                        error == "brenix:Device:failed|the end")
                << error;
        }
    }

    std::mt19937_64 random, deviceRandom;
    std::uint64_t limit = 0;
    Worker* device = nullptr;
    DeviceStreams* deviceStreams = nullptr; ///< once the device has begun
    std::string overflow;
    bool isMixed = false;              ///< whether there is a filter
    std::atomic<bool> resting = false; ///< whether the device is to rest
    std::atomic<bool> isInPush = false;
    int budget = 0; ///< packets that it may still bring

    // Counts of this stream: of earlier openings, and of this one. The device's thread owns `next`.
    std::uint64_t opening = 0, earlier = 0, next = 0;
    std::uint64_t wasRead = 0, flushed = 0, lostEarlier = 0, told = 0;
    std::atomic<std::uint64_t> toldOtherwise = 0; ///< by errors of filter and converter
    std::uint64_t flushes = 0;                    ///< that discarded nobody knows how much
    bool mayPend = false;                         ///< whether a packet may wait beside the queue

    std::atomic<std::uint64_t> position = 0; ///< all before it the caller has done with
    std::uint64_t least = 0;                 ///< of what may still be read
    std::optional<Rig> rig;                  ///< ends first
};

} // namespace

TEST(LossTest, WhatIsReadLostAndLeftIsWhatWasDelivered)
{
    soak(1, [](std::uint64_t seed) { return Sequence(seed).run(); });
}
