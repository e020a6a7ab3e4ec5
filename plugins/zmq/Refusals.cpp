#include "Refusals.hpp"

namespace zeromq
{

void Refusals::add(const std::string& what)
{
    constexpr std::size_t most = 4; // that one text tells
    if (refusals.size() < most || refusals.contains(what)) {
        ++refusals[what];
    } else {
        ++refusals["others"];
    }
}

void Refusals::tell(const std::string& endpoint)
{
    if (refusals.empty()) {
        return;
    }
    std::string text =
        (binds ? "Peers were refused at " : "Could not be a peer of ") + endpoint + ": ";
    const char* separator = "";
    for (const auto& [what, times] : refusals) {
        text += separator + what;
        text += times > 1 ? " (" + std::to_string(times) + " times)" : "";
        separator = "; ";
    }
    text += ".";
    refusals.clear();
    nextTelling = Clock::now() + std::chrono::seconds(1);
    host.raise("error", binds ? "brenix:Device:peerRefused" : "brenix:Device:refused",
               text.c_str());
}

} // namespace zeromq
