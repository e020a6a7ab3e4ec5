// The device gstreamer beside gst-launch-1.0 and sox.

#include "Driver.hpp"
#include "brenixcore/plugin/Inspect.hpp"

#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>

using namespace driver;

namespace
{

class GstreamerTest : public testing::Test
{
protected:
    ~GstreamerTest() override { std::remove(file.c_str()); }

    static void run(const std::string& command)
    {
        ASSERT_EQ(std::system(command.c_str()), 0) << command; // NOLINT(cert-env33-c)
    }

    std::string content() const
    {
        std::ifstream stream(file, std::ios::binary);
        return {std::istreambuf_iterator<char>(stream), {}};
    }

    /// All buffers, once the pipeline has ended: their bytes, and the Index of each.
    template <typename T>
    static std::vector<T> readAll(Channel& reader, const char* type,
                                  std::vector<std::uint64_t>* indices = nullptr)
    {
        reader.waitForEnd();
        Numbers counts(256);
        double buffers = 256;
        double total = 0;
        EXPECT_EQ(coderInputStreamPeek(reader.input, &total, counts.data(), &buffers, infinity), 1);
        EXPECT_EQ(coderInputStreamReadBuffers(reader.input, total, buffers), 1) << reader.error();
        std::vector<T> all;
        for (int32_t buffer = 1; buffer <= static_cast<int32_t>(buffers); ++buffer) {
            std::vector<T> part(static_cast<std::size_t>(counts.at(std::size_t(buffer) - 1)) *
                                reader.property<uint32_t>("Channels", "uint32"));
            EXPECT_EQ(coderInputStreamReadBufferData(reader.input, buffer, 0, "data", type,
                                                     int32_t(part.size()), part.data()),
                      1)
                << reader.error();
            all.insert(all.end(), part.begin(), part.end());
            if (indices != nullptr) {
                EXPECT_EQ(coderInputStreamReadBufferData(reader.input, buffer, 0, "Index", "uint64",
                                                         1, &indices->emplace_back()),
                          1)
                    << reader.error();
            }
        }
        return all;
    }

    /// What comes in a format is, in our order of bytes and at full scale, what gst-launch-1.0 writes.
    template <typename T>
    void expectFormat(const std::string& format, std::size_t width, bool isBig, int shift)
    {
        SCOPED_TRACE(format);
        const std::string pipeline =
            "audiotestsrc num-buffers=3 samplesperbuffer=50 freq=1234 ! audioconvert dithering=none"
            " ! audio/x-raw,channels=2,rate=8000,format=" +
            format;
        run("gst-launch-1.0 -q " + pipeline + " ! filesink location=" + file);
        std::vector<T> expected;
        const std::string bytes = content();
        for (std::size_t at = 0; at < bytes.size(); at += width) {
            std::uint64_t bits = 0;
            for (std::size_t i = 0; i < width; ++i) {
                bits |= std::uint64_t(
                            static_cast<unsigned char>(bytes[at + (isBig ? width - 1 - i : i)]))
                        << (8 * i);
            }
            bits <<= shift;
            std::memcpy(&expected.emplace_back(), &bits, sizeof(T));
        }
        Channel reader("gstreamer");
        reader.start({{"Pipeline", pipeline}});
        reader.waitForEnd();
        char type[16] = "";
        coderChannelGetPropertyValue(reader.handle, "ElementType", "char", sizeof type, type);
        const auto read = readAll<T>(reader, type);
        EXPECT_EQ(read.size(), 300);
        EXPECT_EQ(read, expected);
        EXPECT_EQ(reader.property<double>("SampleRate", "double"), 8000);
    }

    const std::string file = testing::TempDir() + "gstreamer-" + std::to_string(getpid());
};

TEST_F(GstreamerTest, AudioOfAnyFormatIsItsOwnElementType)
{
    expectFormat<std::int8_t>("S8", 1, false, 0);
    expectFormat<std::uint8_t>("U8", 1, false, 0);
    expectFormat<std::int16_t>("S16LE", 2, false, 0);
    expectFormat<std::int16_t>("S16BE", 2, true, 0);
    expectFormat<std::uint16_t>("U16LE", 2, false, 0);
    expectFormat<std::int32_t>("S24LE", 3, false, 8);
    expectFormat<std::int32_t>("S24BE", 3, true, 8);
    expectFormat<std::int32_t>("S24_32LE", 4, false, 8);
    expectFormat<std::int32_t>("S20LE", 3, false, 12);
    expectFormat<std::int32_t>("S32LE", 4, false, 0);
    expectFormat<std::uint32_t>("U32BE", 4, true, 0);
    expectFormat<float>("F32LE", 4, false, 0);
    expectFormat<double>("F64LE", 8, false, 0);
    expectFormat<double>("F64BE", 8, true, 0);
}

TEST_F(GstreamerTest, OggFileIsDecoded)
{
    const std::string ogg = file + ".ogg";
    run("sox -n -r 8000 -c 2 " + ogg + " synth 0.25 sine 440 sine 880");
    run("sox " + ogg + " -t raw -e float -b 32 " + file);
    const std::string bytes = content();
    std::vector<float> expected(bytes.size() / sizeof(float));
    std::memcpy(expected.data(), bytes.data(), bytes.size());
    Channel reader("gstreamer");
    reader.start({{"Pipeline", "filesrc location=" + ogg + " ! decodebin"}});
    const auto read = readAll<float>(reader, "float");
    ASSERT_EQ(read.size(), 4000);
    ASSERT_EQ(expected.size(), read.size());
    for (std::size_t i = 0; i < read.size(); ++i) {
        ASSERT_NEAR(read[i], expected[i], 1e-4) << i;
    }
    EXPECT_EQ(reader.error(coderChannelGetLastAsyncError), "|");
    std::remove(ogg.c_str());
}

TEST_F(GstreamerTest, DroppedBuffersAreLostCounts)
{
    const std::string source = "audiotestsrc num-buffers=128 samplesperbuffer=10 ! audio/x-raw,"
                               "format=S16LE,channels=1,rate=8000";
    run("gst-launch-1.0 -q " + source + " ! filesink location=" + file);
    const std::string bytes = content();
    Channel reader("gstreamer");
    reader.start({{"Pipeline", source + " ! identity drop-probability=0.5"}, {"Stamps", 1}});
    std::vector<std::uint64_t> indices;
    const auto read = readAll<std::int16_t>(reader, "int16", &indices);
    ASSERT_LT(indices.size(), 128U);
    for (std::size_t i = 0; i < indices.size(); ++i) { // the first buffers may be among the dropped
        const std::size_t at = (indices[i] - indices[0]) * 2;
        const std::size_t first = bytes.find(std::string(reinterpret_cast<const char*>(read.data()),
                                                         20)); // where what was read begins
        ASSERT_LE(first + at + 20, bytes.size()) << i;
        ASSERT_EQ(std::memcmp(&read[i * 10], bytes.data() + first + at, 20), 0) << i;
    }
}

TEST_F(GstreamerTest, WrittenFileIsFinalised)
{
    Channel writer("gstreamer");
    writer.start({{"Pipeline", "wavenc ! filesink location=" + file + ".wav"},
                  {"Mode", "write"},
                  {"Caps", "audio/x-raw,format=F64LE,rate=8000,channels=2,layout=interleaved"}});
    EXPECT_EQ(writer.write({0.5, -0.5, 0.25}), 3);
    EXPECT_EQ(writer.write({-0.25, 1}), 2); // a frame in two buffers, and one without its end
    writer.close();
    EXPECT_EQ(writer.error(coderChannelGetLastAsyncError),
              "brenix:Device:failed|The last frame has 1 of 2 samples and was not written.");
    run("sox " + file + ".wav -t raw -e float -b 64 " + file);
    const std::string bytes = content();
    ASSERT_EQ(bytes.size(), 4 * sizeof(double));
    Numbers samples(4);
    std::memcpy(samples.data(), bytes.data(), bytes.size());
    EXPECT_EQ(samples, Numbers({0.5, -0.5, 0.25, -0.25}));
    std::remove((file + ".wav").c_str());
}

TEST_F(GstreamerTest, ErrorsNameTheirElement)
{
    Channel unknown("gstreamer");
    EXPECT_EQ(unknown.init({{"Pipeline", "nosuch ! fakesink"}}), 0);
    EXPECT_EQ(unknown.error(), unexpected + "Option Pipeline: no element \"nosuch\".");

    Channel missing("gstreamer");
    EXPECT_EQ(missing.init({{"Pipeline", "filesrc name=disk location=/nonexistent/a"}}), 1);
    EXPECT_EQ(missing.open(), 0);
    EXPECT_EQ(missing.error(), unexpected + "disk: Resource not found. (No such file "
                                            "\"/nonexistent/a\")");

    Channel silent("gstreamer"); // without its uri, this element fails with no message
    EXPECT_EQ(silent.init({{"Pipeline", "uridecodebin3"}}), 1);
    EXPECT_EQ(silent.open(), 0);
    EXPECT_EQ(silent.error(),
              unexpected + "An element refused to start and told no reason: uridecodebin3");

    for (int i = 0; i < 50; ++i) { // it fails while open waits
        Channel early("gstreamer");
        EXPECT_EQ(early.init({{"Pipeline", "audiotestsrc ! identity name=early error-after=1"}}),
                  1);
        EXPECT_EQ(early.open(), 0);
        EXPECT_EQ(early.error(), unexpected + "early: Failed after iterations as requested.");
    }

    Channel failing("gstreamer");
    failing.start({{"Pipeline", "audiotestsrc ! identity name=late error-after=3"}});
    EXPECT_EQ(failing.asyncError(),
              "brenix:Device:failed|late: Failed after iterations as requested.");
}

TEST_F(GstreamerTest, CloseDoesNotHang)
{
    ASSERT_EQ(mkfifo(file.c_str(), 0600), 0); // to open it waits for a writer
    Channel stuck("gstreamer");
    stuck.start({{"Pipeline", "filesrc location=" + file}});
    EXPECT_EQ(stuck.close(), 0);
    EXPECT_EQ(stuck.error(), unexpected +
                                 "The pipeline did not stop within 3 seconds and is left "
                                 "behind: filesrc location=" +
                                 file);
    std::fclose(std::fopen(file.c_str(), "w")); // which lets it go

    Channel slow("gstreamer"); // a sample takes a second
    slow.start({{"Pipeline", "fakesink sync=true"},
                {"Mode", "write"},
                {"Caps", "audio/x-raw,format=F64LE,rate=1,channels=1,layout=interleaved"},
                {"CloseTimeout", 0.1}});
    for (int i = 0; i < 100; ++i) {
        EXPECT_EQ(slow.write({1.0}), 1);
    }
    slow.close();
    const std::string error = slow.error(coderChannelGetLastAsyncError);
    EXPECT_NE(error.find("CloseTimeout"), std::string::npos) << error;
    EXPECT_NE(error.find(" elements were not taken."), std::string::npos) << error;
}

TEST_F(GstreamerTest, FindDoesNotHang)
{
    sockaddr_un address{AF_UNIX, {}};
    ASSERT_LT(file.size(), sizeof address.sun_path);
    file.copy(address.sun_path, file.size());
    const int silent = socket(AF_UNIX, SOCK_STREAM, 0); // until the program ends
    ASSERT_EQ(bind(silent, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(listen(silent, 9), 0);
    setenv("PULSE_SERVER", ("unix:" + file).c_str(), 1);
    EXPECT_EQ(brenixcore::plugin::findDevices("gstreamer").message,
              "GStreamer has not found out within 3 seconds what is there; a sound server may not "
              "answer.");
}

} // namespace
