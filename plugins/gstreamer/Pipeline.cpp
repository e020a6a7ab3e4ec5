#include "Pipeline.hpp"

#include <gst/app/gstappsink.h>
#include <gst/app/gstappsrc.h>

#include <atomic>
#include <stdexcept>
#include <thread>
#include <utility>

namespace gstreamer
{

namespace
{

constexpr const char* endName = "brenix-end";

/// A change of state on a thread of its own, for it may wait for a device or for another machine, even for ever.
std::shared_ptr<std::atomic<Change>> change(GstElement* pipeline, GstState state,
                                            const std::shared_ptr<Signal>& signal)
{
    auto progress = std::make_shared<std::atomic<Change>>(Change::underWay);
    std::thread([progress, signal, state,
                 held = Owned<GstElement>(GST_ELEMENT(gst_object_ref(pipeline)))]() mutable {
        const auto result = gst_element_set_state(held.get(), state);
        held.reset();
        *progress = result == GST_STATE_CHANGE_FAILURE ? Change::failed : Change::done;
        signal->set();
    }).detach();
    return progress;
}

void set(gpointer data)
{
    (*static_cast<std::shared_ptr<Signal>*>(data))->set();
}

/// What an error says, and the name of its element.
std::string describe(GstMessage* message)
{
    GError* error = nullptr;
    char* detail = nullptr;
    gst_message_parse_error(message, &error, &detail);
    const Owned<GError> ownedError(error);
    const Owned<char> ownedDetail(detail);
    const std::string text = std::string(GST_MESSAGE_SRC_NAME(message)) + ": " + error->message;
    const std::string all = detail == nullptr ? "" : detail;
    // The first line of the detail is a place in the source, the last what the system said.
    const auto last = all.find_last_of('\n');
    return last == std::string::npos ? text : text + " (" + all.substr(last + 1) + ")";
}

/// Reads a message itself: the bus would put it into its queue only after whoever waits was told.
GstBusSyncReply tell(GstBus* /*bus*/, GstMessage* message, gpointer data)
{
    const Owned<GstMessage> owned(message);
    Signal& signal = **static_cast<std::shared_ptr<Signal>*>(data);
    if (GST_MESSAGE_TYPE(message) == GST_MESSAGE_EOS) {
        signal.hasEnded = true;
    } else if (GST_MESSAGE_TYPE(message) == GST_MESSAGE_ERROR) {
        signal.fail(describe(message));
    }
    signal.set();
    return GST_BUS_DROP;
}

void forget(gpointer data)
{
    delete static_cast<std::shared_ptr<Signal>*>(data);
}

} // namespace

void prepare()
{
    static std::once_flag once;
    std::call_once(once, [] {
        gst_segtrap_set_enabled(FALSE); // signals are the program's
        GError* error = nullptr;
        if (gst_init_check(nullptr, nullptr, &error) == FALSE) {
            const Owned<GError> owned(error);
            throw std::runtime_error("GStreamer does not start: " +
                                     std::string(error == nullptr ? "" : error->message));
        }
    });
}

Format formatOf(const GstCaps* caps)
{
    Format format;
    const GstStructure* const structure = gst_caps_get_structure(caps, 0);
    if (!gst_structure_has_name(structure, "audio/x-raw")) {
        return format;
    }
    GstAudioInfo info;
    gst_audio_info_init(&info);
    if (gst_audio_info_from_caps(&info, caps) == FALSE) {
        const Owned<char> text(gst_caps_to_string(caps));
        throw std::runtime_error("Audio of these caps is not known: " + std::string(text.get()));
    }
    if (info.layout != GST_AUDIO_LAYOUT_INTERLEAVED) {
        throw std::runtime_error(
            "The channels of the audio are not interleaved: an audioconvert at "
            "the end of Pipeline makes them so.");
    }
    const int width = GST_AUDIO_INFO_WIDTH(&info);
    const bool isWhole = width == GST_AUDIO_INFO_DEPTH(&info) && width != 24;
    if (GST_AUDIO_INFO_IS_FLOAT(&info)) {
        format.type = bytes::findType(width == 32 ? "float" : "double");
    } else if (!isWhole) {
        format.type = bytes::findType("int32");
        format.packed = info.finfo;
    } else {
        const std::string sign = GST_AUDIO_INFO_IS_SIGNED(&info) ? "int" : "uint";
        format.type = bytes::findType(sign + std::to_string(width));
    }
    format.isAudio = true;
    format.reverses = isWhole && width > 8 && GST_AUDIO_INFO_ENDIANNESS(&info) != G_BYTE_ORDER;
    format.frameSize = static_cast<std::size_t>(GST_AUDIO_INFO_BPF(&info));
    format.channels = static_cast<std::size_t>(GST_AUDIO_INFO_CHANNELS(&info));
    format.rate = GST_AUDIO_INFO_RATE(&info);
    return format;
}

Pipeline::Pipeline(std::string itsDescription, const std::string& caps, bool writes)
    : description(std::move(itsDescription)), isWritten(writes)
{
    const std::string end = endName;
    const std::string text = writes ? "appsrc name=" + end + " ! " + description
                                    : description + " ! appsink name=" + end;
    GError* error = nullptr;
    pipeline.reset(
        gst_parse_launch_full(text.c_str(), nullptr, GST_PARSE_FLAG_FATAL_ERRORS, &error));
    const Owned<GError> owned(error);
    if (!pipeline || error != nullptr) {
        throw std::invalid_argument(error == nullptr ? "is no pipeline" : error->message);
    }
    ours.reset(gst_bin_get_by_name(GST_BIN(pipeline.get()), endName));
    if (!caps.empty()) {
        const Owned<GstCaps> wanted(gst_caps_from_string(caps.c_str()));
        g_object_set(ours.get(), "caps", wanted.get(), nullptr);
    }
    if (writes) {
        g_object_set(ours.get(), "format", GST_FORMAT_TIME, "max-bytes", guint64{1} << 20, nullptr);
        GstAppSrcCallbacks callbacks{};
        callbacks.need_data = [](GstAppSrc* /*source*/, guint /*length*/, gpointer data) {
            set(data);
        };
        gst_app_src_set_callbacks(GST_APP_SRC(ours.get()), &callbacks,
                                  new std::shared_ptr<Signal>(told), forget);
    } else {
        g_object_set(ours.get(), "sync", FALSE, "drop", FALSE, "qos", FALSE, "max-buffers", 8,
                     nullptr);
        GstAppSinkCallbacks callbacks{};
        callbacks.eos = [](GstAppSink* /*sink*/, gpointer data) { set(data); };
        const auto arrive = [](GstAppSink* /*sink*/, gpointer data) {
            (*static_cast<std::shared_ptr<Signal>*>(data))->hasData = true;
            set(data);
            return GST_FLOW_OK;
        };
        callbacks.new_preroll = arrive;
        callbacks.new_sample = arrive;
        gst_app_sink_set_callbacks(GST_APP_SINK(ours.get()), &callbacks,
                                   new std::shared_ptr<Signal>(told), forget);
    }
    const Owned<GstBus> bus(gst_element_get_bus(pipeline.get()));
    gst_bus_set_sync_handler(bus.get(), tell, new std::shared_ptr<Signal>(told), forget);
}

Pipeline::~Pipeline()
{
    if (isRunning) {
        stop();
    }
}

void Pipeline::start()
{
    isRunning = true;
    const auto end = std::chrono::steady_clock::now() + patience;
    try {
        start(end);
    } catch (...) {
        stop(end); // the caller waits no longer for what fails
        throw;
    }
}

void Pipeline::start(std::chrono::steady_clock::time_point end)
{
    starting = change(pipeline.get(), GST_STATE_PLAYING, told);
    for (;;) {
        if (told->hasData) { // what fails from here on fails behind what came
            return;
        }
        const bool isOver = *starting != Change::underWay;
        check();
        // A pipeline that is written to has to wait for something written.
        const auto state = gst_element_get_state(pipeline.get(), nullptr, nullptr, 0);
        const bool isUp = state != GST_STATE_CHANGE_ASYNC && state != GST_STATE_CHANGE_FAILURE;
        const bool isDone = isOver && (isWritten || isUp); // what failed since is about to tell it
        if (isDone || told->hasEnded || std::chrono::steady_clock::now() >= end) {
            return;
        }
        told->wait(end);
    }
}

bool Pipeline::stop(std::chrono::steady_clock::time_point end)
{
    isRunning = false;
    const auto stopping = change(pipeline.get(), GST_STATE_NULL, told);
    const auto isDone = [&] { return *stopping != Change::underWay; };
    while (!isDone() && std::chrono::steady_clock::now() < end) {
        told->wait(end);
    }
    if (!isDone()) { // its thread has the last reference, and releases it if it ever can
        ours.reset();
        pipeline.reset();
        return false;
    }
    return true;
}

void Pipeline::check()
{
    const bool hasFailed = *starting == Change::failed; // before the look for what it told
    std::string problem = told->problem();
    if (hasFailed && problem.empty()) {
        problem = "An element refused to start and told no reason: " + description;
    }
    if (!problem.empty()) {
        throw std::runtime_error(problem);
    }
}

bool Pipeline::hasEnded()
{
    check();
    return told->hasEnded;
}

} // namespace gstreamer
