#ifndef BRENIXCORE_SRC_FILTERCHAIN_HPP
#define BRENIXCORE_SRC_FILTERCHAIN_HPP

#include "Plugin.hpp"

#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace brenixcore
{

/// The filters of a stream, in the order in which they apply.
class FilterChain
{
public:
    /// The libraries outlive every packet that a filter touched.
    explicit FilterChain(std::list<PluginLibrary>& pluginLibraries) : libraries(pluginLibraries) {}

    bool empty() const { return filters.empty(); }

    /// While no packet comes. The options stay the caller's, here and below.
    void add(const std::string& name, const brenixplugin::PropertyMap& options);
    void tune(const brenixplugin::PropertyMap& options);

    /// Applies them, up to the one that leaves no counts.
    void apply(plugin::Packet& packet);

private:
    std::list<PluginLibrary>& libraries;
    std::mutex mutex; ///< for their operations are never called at the same time
    std::vector<std::unique_ptr<plugin::Filter>> filters;
};

} // namespace brenixcore

#endif
