// Loading of plug-ins.
#ifndef BRENIXCORE_SRC_PLUGIN_HPP
#define BRENIXCORE_SRC_PLUGIN_HPP

#include "brenixcore/Exceptions.hpp"
#include "brenixcore/plugin/Inspect.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <array>
#include <cstddef>
#include <exception>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <utility>

/// For the implementations of exported classes, which are not exported themselves.
#define BRENIXCORE_INTERNAL __attribute__((visibility("hidden")))

namespace brenixcore
{

/// Where a plug-in is looked for: a path with a slash is used as it stands, a bare name is a file of
/// the plug-in folder.
std::string pluginPath(const std::string& name);

/// Throws for what is there but is no regular file: opening a pipe, say, could wait without end.
void requireNoOtherFile(const std::string& path);

/// What a plug-in can be.
struct PluginKind {
    const char* name;
    const char* factory;
};
inline constexpr std::array pluginKinds = {PluginKind{"Device", "brenixcoreCreateDevice"},
                                           PluginKind{"Converter", "brenixcoreCreateConverter"},
                                           PluginKind{"Filter", "brenixcoreCreateFilter"}};

/// The index of the kind that an interface is.
template <typename Interface>
constexpr std::size_t kindOf = std::is_same_v<Interface, plugin::Device>      ? 0
                               : std::is_same_v<Interface, plugin::Converter> ? 1
                                                                              : 2;

/// A loaded shared library; unloads it.
class PluginLibrary
{
public:
    /// Throws std::runtime_error with the reason.
    explicit PluginLibrary(const std::string& path);

    /// Throws std::runtime_error with both versions when the plug-in was made for another.
    void requireAbiVersion() const;

    bool has(const char* symbol) const noexcept;

    /// The kind of which it is; throws std::runtime_error when it is of none.
    const PluginKind& kind() const;

    /// Throws std::runtime_error when it is of another kind than that of the name.
    void requireKind(const std::string& name) const;

    /// An exported function; throws std::runtime_error when there is none of that name.
    template <typename Function>
    Function* function(const char* symbol) const
    {
        return reinterpret_cast<Function*>(address(symbol));
    }

private:
    struct Unload {
        void operator()(void* library) const noexcept;
    };

    void* address(const char* symbol) const;

    std::unique_ptr<void, Unload> handle;
};

/// The object of a plug-in, and its library, which must outlive all that the object made.
template <typename Interface>
struct LoadedPlugin {
    PluginLibrary library;
    std::unique_ptr<Interface> object;
};

/// Text of the exception in flight. Only inside a catch handler, while the module that threw is
/// loaded.
std::string currentExceptionText();

/// Makes the object of a loaded plug-in, which must be of the kind.
template <typename Interface>
std::unique_ptr<Interface> createPlugin(const PluginLibrary& library)
{
    constexpr PluginKind kind = pluginKinds[kindOf<Interface>];
    library.requireKind(kind.name);
    std::unique_ptr<Interface> object(library.function<Interface*()>(kind.factory)());
    if (!object) {
        throw std::runtime_error("the factory returned nothing");
    }
    return object;
}

/// Loads a plug-in and makes its object. Whatever goes wrong becomes one of the two exceptions
/// while the library, to which an exception may belong, is still loaded.
template <typename Interface, typename LoadError, typename CreateError>
LoadedPlugin<Interface> loadPlugin(const std::string& name)
{
    std::optional<PluginLibrary> library;
    std::string path = name;
    try {
        path = pluginPath(name);
        library.emplace(path);
        library->requireAbiVersion();
    } catch (...) {
        throw LoadError("Could not load " + path + ": " + currentExceptionText());
    }
    std::unique_ptr<Interface> object;
    try {
        object = createPlugin<Interface>(*library);
    } catch (...) {
        throw CreateError("Could not create " + path + ": " + currentExceptionText());
    }
    return {*std::move(library), std::move(object)};
}

} // namespace brenixcore

#endif
