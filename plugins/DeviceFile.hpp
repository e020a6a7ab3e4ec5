// Whether a device file may be used, and what would help where not.
#ifndef BRENIX_PLUGINS_DEVICE_FILE_HPP
#define BRENIX_PLUGINS_DEVICE_FILE_HPP

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <string>
#include <system_error>

namespace devicefile
{

/// The name of a group, or its number where it has none.
inline std::string groupName(gid_t id)
{
    std::array<char, 4096> text{};
    group entry{};
    group* found = nullptr;
    ::getgrgid_r(id, &entry, text.data(), text.size(), &found);
    return found == nullptr ? std::to_string(id) : found->gr_name;
}

/// Why this process may not read and write a file, and what would help, in a line, where the files of its kind usually
/// are for a group; empty when it may. The path is the one to tell, which is looked for below the root.
inline std::string problem(const std::string& path, const std::string& usualGroup,
                           const std::string& root = "")
{
    const std::string file = root + path;
    if (::faccessat(AT_FDCWD, file.c_str(), R_OK | W_OK, AT_EACCESS) == 0) {
        return "";
    }
    const int error = errno;
    struct stat status {
    };
    if (error == EACCES && ::stat(file.c_str(), &status) == 0) {
        const std::string name = groupName(status.st_gid);
        const mode_t both = S_IRGRP | S_IWGRP;
        if ((status.st_mode & both) == both && status.st_gid != 0) {
            return path + " is for group " + name + ": sudo usermod -aG " + name +
                   " $USER, then log in again";
        }
        return path +
               " is for its owner alone: a rule of udev can give it to a group, such as "
               "KERNEL==\"" +
               path.substr(path.rfind('/') + 1) + R"(", GROUP=")" + usualGroup +
               R"(", MODE="0660")";
    }
    return path + ": " + std::generic_category().message(error) +
           (error == ENOENT ? "; a container has to be given it" : "");
}

} // namespace devicefile

#endif
