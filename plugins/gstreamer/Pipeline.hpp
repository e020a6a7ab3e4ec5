// A pipeline of GStreamer with an end of ours, whose state changes nobody has to wait for.
#ifndef BRENIX_PLUGINS_GSTREAMER_PIPELINE_HPP
#define BRENIX_PLUGINS_GSTREAMER_PIPELINE_HPP

#include "ElementTypes.hpp"

#include <gst/audio/audio.h>
#include <gst/gst.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <utility>

namespace gstreamer
{

/// How long a pipeline may take to start, and to stop, and a look for devices.
constexpr std::chrono::seconds patience{3};

struct Release {
    void operator()(void* object) const noexcept { gst_object_unref(object); }
    void operator()(GstCaps* caps) const noexcept { gst_caps_unref(caps); }
    void operator()(GstSample* sample) const noexcept { gst_sample_unref(sample); }
    void operator()(GstMessage* message) const noexcept { gst_message_unref(message); }
    void operator()(GError* error) const noexcept { g_error_free(error); }
    void operator()(char* text) const noexcept { g_free(text); }
};
template <typename T>
using Owned = std::unique_ptr<T, Release>;

/// Makes the library ready. Throws where it cannot be.
void prepare();

/// What the elements of a stream are, as its caps say.
struct Format {
    const bytes::ElementType* type = bytes::findType("uint8");
    bool isAudio = false;
    bool reverses = false; ///< the bytes of each element
    const GstAudioFormatInfo* packed =
        nullptr;               ///< of samples that are no elements: 24 bits and such
    std::size_t frameSize = 1; ///< bytes of a count in the pipeline
    std::size_t channels = 1;
    double rate = 0; ///< counts a second; 0: not known
};

/// Throws where it is audio that cannot be delivered.
Format formatOf(const GstCaps* caps);

/// What waits for the pipeline and for the channel, on whatever threads they tell. Outlives a pipeline that hangs.
class Signal
{
public:
    void set()
    {
        const std::lock_guard lock(mutex);
        isSet = true;
        changed.notify_all();
    }

    /// Keeps what an element failed with first.
    void fail(std::string text)
    {
        const std::lock_guard lock(mutex);
        if (firstProblem.empty()) {
            firstProblem = std::move(text);
        }
    }
    std::string problem()
    {
        const std::lock_guard lock(mutex);
        return firstProblem;
    }

    /// Waits for set() since the last wait.
    void wait(std::chrono::steady_clock::time_point end)
    {
        std::unique_lock lock(mutex);
        changed.wait_until(lock, end, [this] { return isSet; });
        isSet = false;
    }

    std::atomic<bool> hasData = false;  ///< whether a buffer has come to our end
    std::atomic<bool> hasEnded = false; ///< whether the end of the stream has come to all sinks

private:
    std::mutex mutex;
    std::condition_variable changed;
    bool isSet = false;
    std::string firstProblem;
};

/// How far a change of state is.
enum class Change { underWay, done, failed };

class Pipeline
{
public:
    /// Makes the elements. Throws std::invalid_argument with what is wrong in the description.
    Pipeline(std::string description, const std::string& caps, bool writes);
    Pipeline(const Pipeline&) = delete;
    Pipeline& operator=(const Pipeline&) = delete;
    ~Pipeline();

    /// Starts it, and waits until that is done, or the patience has run out: it may go on meanwhile. Of one that
    /// fails, the patience includes the stop.
    void start();

    /// Stops it. Returns false where it has not stopped in time, and is left behind.
    bool stop(std::chrono::steady_clock::time_point end = std::chrono::steady_clock::now() +
                                                          patience);

    /// Throws the error of an element, if there was one, or of one that failed to start. Not before start().
    void check();

    /// Whether the end of the stream has come to all sinks. Throws as check() does.
    bool hasEnded();

    GstElement* end() const { return ours.get(); }
    GstElement* all() const { return pipeline.get(); }
    Signal& signal() const { return *told; }

private:
    void start(std::chrono::steady_clock::time_point end);

    const std::string description;
    const bool isWritten;
    const std::shared_ptr<Signal> told = std::make_shared<Signal>();
    Owned<GstElement> pipeline;
    Owned<GstElement> ours;                        ///< our end
    std::shared_ptr<std::atomic<Change>> starting; ///< since start()
    bool isRunning = false;                        ///< for which it was started
};

} // namespace gstreamer

#endif
