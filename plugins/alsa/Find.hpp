// The sound cards that there are.
#ifndef BRENIX_PLUGINS_ALSA_FIND_HPP
#define BRENIX_PLUGINS_ALSA_FIND_HPP

#include "DeviceFile.hpp"
#include "brenixcore/plugin/Find.hpp"

#include <filesystem>
#include <set>
#include <string>
#include <system_error>
#include <vector>

namespace alsa
{

/// Appends the PCMs that libasound lists, for each direction, and the cards that it does not list as they may not be
/// used.
void findCards(std::vector<brenixcore::plugin::Found>& found);

/// Appends the cards that may not be used. All files are looked for below the root.
inline void findForbidden(std::vector<brenixcore::plugin::Found>& found,
                          const std::string& root = "")
{
    std::error_code none;
    std::set<std::string> numbers;
    for (const auto& entry : std::filesystem::directory_iterator(root + "/sys/class/sound", none)) {
        const std::string name = entry.path().filename();
        if (name.rfind("card", 0) == 0) {
            numbers.insert(name.substr(4));
        }
    }
    for (const std::string& number : numbers) {
        const auto problem = devicefile::problem("/dev/snd/controlC" + number, "audio", root);
        if (!problem.empty()) {
            found.push_back({"sound card " + number, {{"Card", "plughw:" + number}}, problem});
        }
    }
}

} // namespace alsa

#endif
