// What is found by devices that look for it, in folders that are made to look like the system's.

#include "alsa/Find.hpp"
#include "SerialPorts.hpp"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace fs = std::filesystem;

TEST(FindTest, WhatIsThereIsFoundAndWhyItMayNotBeOpened)
{
    const fs::path root = testing::TempDir() + "find-" + std::to_string(getpid());
    const fs::path usb = root / "sys/devices/1-1";
    fs::create_directories(usb / "1-1:1.0/ttyUSB0");
    std::ofstream(usb / "product") << "Scale 3 \"kg\"\n";
    std::ofstream(usb / "manufacturer") << "Acme\n";
    fs::create_directories(root / "sys/devices/uart");
    for (const auto& [name, device, type] :
         {std::tuple("ttyUSB0", "1-1/1-1:1.0/ttyUSB0", ""), std::tuple("ttyS0", "uart", "4"),
          std::tuple("ttyS1", "uart", "0"), std::tuple("ttyS2", "uart", "4")}) {
        const fs::path entry = root / "sys/class/tty" / name;
        fs::create_directories(entry);
        fs::create_symlink(fs::path("../../../devices") / device, entry / "device");
        std::ofstream(entry / "type") << type << '\n';
    }
    fs::create_directories(root / "sys/class/tty/ptmx"); // has no device
    fs::create_directories(root / "dev/serial/by-id");
    fs::create_directories(root / "dev/snd");
    for (const char* const name : {"card0", "card1", "pcmC0D0p"}) {
        fs::create_directories(root / "sys/class/sound" / name);
    }
    fs::create_symlink("../../ttyUSB0", root / "dev/serial/by-id/usb-Acme Scale");
    const bool isRoot = geteuid() == 0; // who may do everything
    const std::string group = isRoot ? "54321" : devicefile::groupName(getgid()); // without a name
    for (const auto& [name, mode] :
         {std::pair("ttyUSB0", 0060), std::pair("ttyS0", 0), std::pair("snd/controlC0", 0060),
          std::pair("snd/controlC1", 0666)}) {
        const fs::path file = root / "dev" / name;
        std::ofstream(file).flush();
        ASSERT_EQ(chmod(file.c_str(), mode_t(mode)), 0);
        ASSERT_TRUE(chown(file.c_str(), 0, 54321) == 0 || !isRoot);
    }

    std::vector<brenixcore::plugin::Found> found;
    if (isRoot) {
        ASSERT_EQ(seteuid(65534), 0);
    }
    serial::findPorts(found, root);
    alsa::findForbidden(found, root);
    if (isRoot) {
        ASSERT_EQ(seteuid(0), 0);
    }
    std::vector<std::string> lines;
    for (const auto& [what, options, problem] : found) {
        lines.push_back(what + '|' + options.at(0).first + '=' + options.at(0).second + '|' +
                        problem);
    }
    const std::string join =
        " is for group " + group + ": sudo usermod -aG " + group + " $USER, then log in again";
    EXPECT_THAT(
        lines,
        testing::ElementsAre(
            "serial port|Port=/dev/ttyS0|/dev/ttyS0 is for its owner alone: a rule of udev can "
            "give it to a group, such as KERNEL==\"ttyS0\", GROUP=\"dialout\", MODE=\"0660\"",
            "serial port|Port=/dev/ttyS2|/dev/ttyS2: No such file or directory; a container has to "
            "be given it",
            "Acme Scale 3 \"kg\", now ttyUSB0|Port=/dev/serial/by-id/usb-Acme Scale|/dev/ttyUSB0" +
                join,
            "Acme Scale 3 \"kg\"|Port=/dev/ttyUSB0|/dev/ttyUSB0" + join,
            "sound card 0|Card=plughw:0|/dev/snd/controlC0" + join));
    fs::remove_all(root);
}
