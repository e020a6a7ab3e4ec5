// The serial ports that the system has.
#ifndef BRENIX_PLUGINS_SERIAL_PORTS_HPP
#define BRENIX_PLUGINS_SERIAL_PORTS_HPP

#include "DeviceFile.hpp"
#include "brenixcore/plugin/Find.hpp"

#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <string>
#include <vector>

namespace serial
{

/// The first line of a file of the system; empty when it has none.
inline std::string lineOf(const std::filesystem::path& file)
{
    std::string line;
    std::getline(std::ifstream(file), line);
    return line;
}

/// What is at the port: of USB, as the adapter or instrument calls itself.
inline std::string portName(const std::filesystem::path& device)
{
    std::error_code ignored;
    auto folder = std::filesystem::canonical(device, ignored);
    for (int level = 0; level < 3; ++level, folder = folder.parent_path()) {
        if (const std::string product = lineOf(folder / "product"); !product.empty()) {
            const std::string maker = lineOf(folder / "manufacturer");
            return maker.empty() ? product : maker + ' ' + product;
        }
    }
    return "serial port";
}

/// Appends each port by the name that follows what is plugged in, if it has one, and by that of the system. All
/// files are looked for below the root.
inline void findPorts(std::vector<brenixcore::plugin::Found>& found, const std::string& root = "")
{
    namespace fs = std::filesystem;
    const std::string ids = "/dev/serial/by-id/";
    std::multimap<std::string, std::string> idsOf;
    std::error_code none;
    for (const auto& entry : fs::directory_iterator(root + ids, none)) {
        idsOf.emplace(fs::read_symlink(entry, none).filename(), entry.path().filename());
    }
    std::set<fs::path> ports;
    for (const auto& entry : fs::directory_iterator(root + "/sys/class/tty")) {
        const bool isThere =
            lineOf(entry.path() / "type") != "0"; // where the driver does not know at first
        if (isThere && fs::exists(entry.path() / "device", none)) {
            ports.insert(entry.path());
        }
    }
    for (const fs::path& port : ports) {
        const std::string name = port.filename();
        const std::string what = portName(port / "device");
        const std::string problem = devicefile::problem("/dev/" + name, "dialout", root);
        const auto [first, last] = idsOf.equal_range(name);
        for (auto id = first; id != last; ++id) {
            found.push_back({what + ", now " + name, {{"Port", ids + id->second}}, problem});
        }
        found.push_back({what, {{"Port", "/dev/" + name}}, problem});
    }
}

} // namespace serial

#endif
