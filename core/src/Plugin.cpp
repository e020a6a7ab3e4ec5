#include "Plugin.hpp"

#include <dlfcn.h>
#include <elf.h>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sstream>
#include <stdexcept>

namespace brenixcore
{

namespace
{

std::string loaderError()
{
    const char* const text = dlerror();
    return text == nullptr ? "the reason is not known" : text;
}

/// Throws for a file that dlopen would map and then die reading, since it ends before the segments
/// that its headers announce. What else is wrong with it, or that it is not there, dlopen says itself.
void requireWholeFile(const std::string& path)
{
    std::error_code error;
    const std::uint64_t size = std::filesystem::file_size(path, error);
    std::ifstream file(path, std::ios::binary);
    Elf64_Ehdr header{};
    file.read(reinterpret_cast<char*>(&header), sizeof header);
    if (std::memcmp(header.e_ident, ELFMAG, SELFMAG) != 0) {
        return;
    }
    Elf64_Phdr segment{};
    file.seekg(static_cast<std::streamoff>(header.e_phoff));
    for (int i = 0; i < header.e_phnum; ++i) {
        file.read(reinterpret_cast<char*>(&segment), sizeof segment);
        if (!file || segment.p_offset > size || segment.p_filesz > size - segment.p_offset) {
            throw std::runtime_error("the file is cut short");
        }
    }
}

/// The file that is mapped at an address, as the system has it; empty when there is none.
std::string mappedFile(std::uintptr_t address)
{
    std::ifstream mappings("/proc/self/maps");
    for (std::string line; std::getline(mappings, line);) {
        // begin-end access offset device inode path
        std::istringstream fields(line);
        std::uintptr_t begin = 0;
        std::uintptr_t end = 0;
        fields >> std::hex >> begin;
        fields.ignore(1);
        fields >> end;
        const std::size_t path = line.find('/');
        if (address >= begin && address < end && path != std::string::npos) {
            return line.substr(path);
        }
    }
    return "";
}

} // namespace

std::string plugin::pluginFolder()
{
    const auto* const here = reinterpret_cast<const char*>(&pluginPath);
    Dl_info info{};
    std::string library = dladdr(here, &info) == 0 ? "" : info.dli_fname;
    if (library.rfind('/', 0) != 0) {
        // The loader found it in a folder relative to what was then the current one.
        library = mappedFile(reinterpret_cast<std::uintptr_t>(here));
    }
    if (library.empty()) {
        throw std::runtime_error("the folder of this library is not known");
    }
    return library.substr(0, library.rfind('/') + 1) + "brenix-plugins/";
}

std::string pluginPath(const std::string& name)
{
    return name.find('/') != std::string::npos ? name : plugin::pluginFolder() + name + ".so";
}

void PluginLibrary::Unload::operator()(void* library) const noexcept
{
    dlclose(library);
}

void requireNoOtherFile(const std::string& path)
{
    std::error_code error;
    const std::filesystem::file_status status = std::filesystem::status(path, error);
    if (std::filesystem::exists(status) && !std::filesystem::is_regular_file(status)) {
        throw std::runtime_error("it is not a regular file");
    }
}

PluginLibrary::PluginLibrary(const std::string& path)
{
    requireNoOtherFile(path);
    requireWholeFile(path);
    // dlopen is declared not to throw, but a static object of the plug-in may. The library is then half
    // loaded and held once, and must not pass for loaded the next time.
    void* (*const volatile open)(const char*, int) = dlopen;
    std::optional<std::string> thrown;
    try {
        handle.reset(open(path.c_str(), RTLD_NOW | RTLD_LOCAL));
    } catch (...) {
        thrown = currentExceptionText();
    }
    if (thrown) {
        handle.reset(dlopen(path.c_str(), RTLD_NOW | RTLD_NOLOAD));
        if (handle) {
            dlclose(handle.get());
        }
        throw std::runtime_error(*thrown);
    }
    if (!handle) {
        throw std::runtime_error(loaderError());
    }
}

void PluginLibrary::requireAbiVersion() const
{
    const std::uint32_t version = function<std::uint32_t()>("brenixcorePluginAbiVersion")();
    if (version != plugin::abiVersion) {
        throw std::runtime_error("it has plug-in ABI version " + std::to_string(version) +
                                 ", needed is " + std::to_string(plugin::abiVersion));
    }
}

bool PluginLibrary::has(const char* symbol) const noexcept
{
    return dlsym(handle.get(), symbol) != nullptr;
}

const PluginKind& PluginLibrary::kind() const
{
    for (const PluginKind& candidate : pluginKinds) {
        if (has(candidate.factory)) {
            return candidate;
        }
    }
    throw std::runtime_error("it exports none of brenixcoreCreateDevice, "
                             "brenixcoreCreateConverter and brenixcoreCreateFilter");
}

void PluginLibrary::requireKind(const std::string& name) const
{
    const std::string found = kind().name;
    if (found != name) {
        const auto noun = [](std::string kindName) {
            kindName[0] = static_cast<char>(kindName[0] - 'A' + 'a');
            return kindName;
        };
        throw std::runtime_error("it is a " + noun(found) + " and no " + noun(name));
    }
}

void* PluginLibrary::address(const char* symbol) const
{
    void* const found = dlsym(handle.get(), symbol);
    if (found == nullptr) {
        throw std::runtime_error(loaderError());
    }
    return found;
}

std::string currentExceptionText()
{
    try {
        throw;
    } catch (const std::exception& exception) {
        const char* const text = exception.what();
        return text == nullptr ? "" : text;
    } catch (...) {
        return "Unrecognized error.";
    }
}

} // namespace brenixcore
