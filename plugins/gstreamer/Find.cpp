#include "Find.hpp"

#include "Pipeline.hpp"

#include <future>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>

namespace gstreamer
{

using brenixcore::plugin::Found;

namespace
{

/// A value as a pipeline's description takes it.
std::string quoted(const std::string& text)
{
    std::string result = "\"";
    for (const char c : text) {
        result += c == '"' || c == '\\' ? std::string{'\\', c} : std::string{c};
    }
    return result + "\"";
}

/// An element as a pipeline's description names it, with what is set otherwise than by default.
std::string describe(GstElement* element)
{
    GstElementFactory* const factory = gst_element_get_factory(element);
    std::string text = GST_OBJECT_NAME(factory);
    guint count = 0;
    GParamSpec** const list = g_object_class_list_properties(G_OBJECT_GET_CLASS(element), &count);
    for (guint i = 0; i < count; ++i) {
        const GParamSpec* const parameter = list[i];
        const std::string name = parameter->name;
        if ((parameter->flags & G_PARAM_READWRITE) != G_PARAM_READWRITE || name == "name" ||
            name == "parent") {
            continue;
        }
        GValue value = G_VALUE_INIT;
        g_value_init(&value, parameter->value_type);
        g_object_get_property(G_OBJECT(element), parameter->name, &value);
        if (g_param_value_defaults(list[i], &value) == FALSE) {
            const Owned<char> written(gst_value_serialize(&value));
            if (G_VALUE_HOLDS_STRING(&value) && g_value_get_string(&value) != nullptr) {
                text += " " + name + "=" + quoted(g_value_get_string(&value));
            } else if (written) {
                text += " " + name + "=" + quoted(written.get());
            }
        }
        g_value_unset(&value);
    }
    g_free(list);
    return text;
}

std::vector<Found> look()
{
    std::vector<Found> found;
    const Owned<GstDeviceMonitor> monitor(gst_device_monitor_new());
    gst_device_monitor_add_filter(monitor.get(), "Audio/Source", nullptr);
    gst_device_monitor_add_filter(monitor.get(), "Video/Source", nullptr);
    if (gst_device_monitor_start(monitor.get()) == FALSE) {
        return found; // there is no provider that could see any
    }
    GList* const devices = gst_device_monitor_get_devices(monitor.get());
    for (const GList* node = devices; node != nullptr; node = node->next) {
        auto* const device = GST_DEVICE(node->data);
        const Owned<char> name(gst_device_get_display_name(device));
        const Owned<char> kind(gst_device_get_device_class(device));
        GstElement* const made = gst_device_create_element(device, nullptr);
        if (made != nullptr) {
            const Owned<GstElement> element(GST_ELEMENT(gst_object_ref_sink(made)));
            found.push_back({std::string(name.get()) + " (" + kind.get() + ")",
                             {{"Pipeline", describe(element.get())}},
                             ""});
        }
    }
    g_list_free_full(devices, gst_object_unref);
    gst_device_monitor_stop(monitor.get());
    return found;
}

} // namespace

void findSources(std::vector<Found>& found)
{
    prepare();
    // On a thread of its own: a sound server that does not answer keeps it for a minute.
    std::packaged_task<std::vector<Found>()> task(look);
    auto looked = task.get_future();
    std::thread(std::move(task)).detach();
    if (looked.wait_for(patience) != std::future_status::ready) {
        throw std::runtime_error("GStreamer has not found out within " +
                                 std::to_string(patience.count()) +
                                 " seconds what is there; a sound server may not answer.");
    }
    for (Found& source : looked.get()) {
        found.push_back(std::move(source));
    }
}

} // namespace gstreamer
