#include "Admission.hpp"

#include "Keys.hpp"

#include <array>
#include <cstddef>
#include <utility>
#include <vector>

namespace zeromq
{

Admission::Admission(void* context, std::string allowedKeysFile)
    : file(std::move(allowedKeysFile)), allowedKeys(readPublicKeys(file)),
      socket(makeSocket(context, ZMQ_REP))
{
    if (zmq_bind(socket.get(), "inproc://zeromq.zap.01") != 0) {
        fail("Could not look after keys");
    }
}

void Admission::answer(Refusals& refusals)
{
    std::vector<std::string> request;
    Frame frame;
    while (frame.receive(socket.get())) {
        request.push_back(frame.text());
        if (frame.hasMore()) {
            continue;
        }
        // Version, request, domain, address, routing id, mechanism, key.
        const bool isKey = request.size() == 7 && request[5] == "CURVE";
        const std::string key = isKey ? keyText(request[6]) : "";
        const bool isAllowed = isKey && allowedKeys.contains(key);
        if (!isAllowed) {
            refusals.add("the key " + key + " from " + (request.size() > 3 ? request[3] : "") +
                         " is not in " + file);
        }
        const std::string id = request.size() > 1 ? request[1] : "";
        const std::array<std::string, 6> reply = {
            "1.0", id, isAllowed ? "200" : "400", isAllowed ? "OK" : "not allowed", key, ""};
        for (std::size_t i = 0; i < reply.size(); ++i) {
            zmq_send(socket.get(), reply.at(i).data(), reply.at(i).size(),
                     ZMQ_DONTWAIT | (i + 1 < reply.size() ? ZMQ_SNDMORE : 0));
        }
        request.clear();
    }
}

} // namespace zeromq
