// The options of the device `nats`.
#ifndef BRENIX_PLUGINS_NATS_SETTINGS_HPP
#define BRENIX_PLUGINS_NATS_SETTINGS_HPP

#include "brenixcore/plugin/Options.hpp"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace natsio
{

enum class Start { New, All, Index, Time };

struct Settings {
    bool writes = false;
    std::vector<std::string> servers; ///< URLs
    std::string subject;
    std::string credentialsFile, caFile, certificateFile, keyFile; ///< empty: none
    std::string serverName; ///< what certificates of servers have to be for; empty: anything
    std::chrono::milliseconds connectTimeout{};
    std::chrono::milliseconds closeTimeout{};

    // JetStream:
    bool keeps = false; ///< is used
    std::string stream; ///< empty: none
    std::int64_t replicas = 1;
    std::int64_t maxAge = 0;   ///< nanoseconds; 0: none
    std::int64_t maxBytes = 0; ///< 0: none
    std::string durable;       ///< empty: none
    Start start = Start::New;
    std::uint64_t startIndex = 0;
    std::int64_t startTime = 0; ///< nanoseconds since 1970
    std::size_t window = 0;     ///< messages that are not acknowledged

    bool usesTls() const;
};

/// Reads the options, but for those of what sends and receives messages.
Settings readSettings(brenixcore::plugin::Options& options);

/// A URL without what its owner keeps to himself.
std::string publicName(const std::string& url);

} // namespace natsio

#endif
