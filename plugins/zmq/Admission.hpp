// Who is let in to a side that binds, by his key.
#ifndef BRENIX_PLUGINS_ZMQ_ADMISSION_HPP
#define BRENIX_PLUGINS_ZMQ_ADMISSION_HPP

#include "Refusals.hpp"
#include "Zmq.hpp"

#include <set>
#include <string>

namespace zeromq
{

/// Answers what libzmq asks when somebody comes, by ZAP, the ZeroMQ Authentication Protocol.
class Admission
{
public:
    /// Reads the keys that are allowed. Throws when they are not as they should be.
    Admission(void* context, std::string allowedKeysFile);

    void* getSocket() const { return socket.get(); }

    /// Lets in those of the list; the others are refused.
    void answer(Refusals& refusals);

private:
    const std::string file;
    const std::set<std::string> allowedKeys;
    const OwnedSocket socket;
};

} // namespace zeromq

#endif
