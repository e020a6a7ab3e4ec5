#include "FilterChain.hpp"

#include "Packets.hpp"

#include <utility>

namespace brenixcore
{

void FilterChain::add(const std::string& name, const brenixplugin::PropertyMap& options)
{
    auto loaded = loadPlugin<plugin::Filter, CouldNotLoadFilter, CouldNotCreateFilter>(name);
    libraries.push_back(std::move(loaded.library));
    plugin::Options given(options);
    loaded.object->tune(given);
    given.requireAllKnown();
    const std::lock_guard lock(mutex);
    filters.push_back(std::move(loaded.object));
}

void FilterChain::tune(const brenixplugin::PropertyMap& options)
{
    plugin::Options given(options);
    const std::lock_guard lock(mutex);
    for (const auto& filter : filters) {
        filter->tune(given);
    }
    given.requireAllKnown(); // to one of them
}

void FilterChain::apply(plugin::Packet& packet)
{
    if (filters.empty()) {
        return;
    }
    const std::lock_guard lock(mutex);
    for (const auto& filter : filters) {
        if (const std::uint64_t before = packet.counts; before > 0) {
            const double period = packet.period;
            filter->apply(packet);
            requireWhole(packet);
            const bool isTold = packet.period != 0 && packet.period != period;
            if (!isTold && packet.counts > 0) { // they take as long as before
                packet.period =
                    period * static_cast<double>(before) / static_cast<double>(packet.counts);
            }
        }
    }
}

} // namespace brenixcore
