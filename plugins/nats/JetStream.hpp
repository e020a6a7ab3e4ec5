// What is kept on the servers: streams, and places of readers in them.
#ifndef BRENIX_PLUGINS_NATS_JETSTREAM_HPP
#define BRENIX_PLUGINS_NATS_JETSTREAM_HPP

#include "Connection.hpp"

#include <cstdint>
#include <memory>
#include <string>

namespace natsio
{

constexpr std::chrono::milliseconds
    ackWait(5000); ///< after which what was not acknowledged comes again

/// How long one may wait for a message that a writer has not got through yet. Longer than servers take to
/// choose one that leads.
constexpr std::chrono::seconds patience(30);

/// A stream, made if it is not there.
struct KeptStream {
    /// Without a name in the settings, finds the one that has the subject.
    /// @throws std::runtime_error
    KeptStream(const Connection& connection, const Settings& settings);

    std::unique_ptr<jsCtx, Destroy<jsCtx_Destroy>> context;
    std::string name;
    std::int64_t replicas = 1;
    std::int64_t maxMessage = 0; ///< bytes; 0: as the server has it
};

/// A reader's place in a stream.
struct Place {
    /// Makes it, or finds that of the same name. @throws std::runtime_error
    Place(const KeptStream& stream, const Settings& settings, Moment until);

    std::string name;
    std::string subject;       ///< under which messages are delivered
    std::uint64_t pending = 0; ///< messages that were delivered before and not acknowledged
};

/// What an answer of a server says of a stream or of a place.
struct State {
    explicit State(const natsMsg* answer);

    bool isGone = false;
    std::uint64_t pending = 0;   ///< delivered and not acknowledged
    std::uint64_t delivered = 0; ///< the last number in the stream that was delivered
    bool isKnown = false;
};

} // namespace natsio

#endif
