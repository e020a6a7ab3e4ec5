// The device hdf5 beside programs of other makers on the same files: h5dump and Python's h5py.

#include "Driver.hpp"

#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <fstream>
#include <thread>

using namespace driver;

namespace
{

/// What a program prints.
std::string output(const std::string& command)
{
    std::string text;
    std::FILE* const pipe = popen((command + " 2>&1").c_str(), "r");
    std::array<char, 4096> part{};
    while (const std::size_t size = std::fread(part.data(), 1, part.size(), pipe)) {
        text.append(part.data(), size);
    }
    EXPECT_EQ(pclose(pipe), 0) << text;
    return text;
}

class Hdf5Test : public testing::Test
{
protected:
    ~Hdf5Test() override { std::remove(file.c_str()); }

    /// What h5py prints, of the open file f.
    std::string python(const std::string& code, const char* mode = "r") const
    {
        return output("/usr/bin/python3 -B -c \"import h5py, numpy as n\nf = h5py.File('" + file +
                      "', '" + mode + "')\n" + code + "\"");
    }

    void record(Channel& writer, Option first = {"Compression", 0},
                Option second = {"SampleRate", 0}) const
    {
        writer.start({{"FileName", file}, {"Mode", "write"}, first, second});
    }

    /// All that can be read from the file; `reader` is to read what stands beside it.
    template <typename T = double>
    std::vector<T> replay(Channel& reader, Option first, Option second = {"Pace", "fast"},
                          Option stamps = {"Stamps", 0}, const char* type = "double") const
    {
        reader.start({{"FileName", file}, first, second, stamps});
        reader.waitForEnd();
        const Numbers counts = reader.peek();
        coderInputStreamReadBuffers(reader.input,
                                    reader.ask(coderStreamGetDataAvailable, reader.input),
                                    double(counts.size()));
        std::vector<T> all;
        int32_t buffer = 0;
        for (const double count : counts) {
            std::vector<T> part(static_cast<std::size_t>(count) *
                                reader.property<uint32_t>("Channels", "uint32"));
            EXPECT_EQ(coderInputStreamReadBufferData(reader.input, ++buffer, 0, "data", type,
                                                     static_cast<int32_t>(part.size()),
                                                     part.data()),
                      1)
                << reader.error();
            all.insert(all.end(), part.begin(), part.end());
        }
        return all;
    }
    template <typename T = double>
    std::vector<T> replay(const char* type = "double") const
    {
        Channel reader("hdf5");
        const auto all =
            replay<T>(reader, {"BlockSize", 1 << 24}, {"Pace", "fast"}, {"Stamps", 0}, type);
        EXPECT_EQ(reader.error(coderChannelGetLastAsyncError), "|");
        return all;
    }

    template <typename T>
    void expectWhatIsWritten(const char* type, const char* inFile) const
    {
        SCOPED_TRACE(type);
        {
            const int compression = type[0] == 'u' ? 0 : 6;
            Channel writer("hdf5");
            writer.start({{"FileName", file},
                          {"Mode", "write"},
                          {"ElementType", type},
                          {"Channels", 3},
                          {"Compression", compression},
                          {"SampleRate", 400}}); // its chunks are smaller than what is written
            std::vector<T> values(9000);
            for (std::size_t i = 0; i < values.size(); ++i) {
                values[i] = static_cast<T>(i % 127);
            }
            for (std::size_t i = 0; i < values.size(); i += 1000) { // which are no whole counts
                double written = 0;
                EXPECT_EQ(coderOutputStreamWriteTypedDataOld(writer.output, &written, 1, type,
                                                             CODER_BUFFER(1000, &values[i])),
                          1)
                    << writer.error();
            }
            EXPECT_EQ(writer.close(), 1);
            EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
            EXPECT_EQ(writer.property<int64_t>("Frames", "int64"), 3000);
            EXPECT_EQ(python("d = f['data']\n"
                             "print(d.dtype.str, d.shape, d.compression_opts, "
                             "(d[...].ravel() == n.arange(9000) % 127).all(), end='')"),
                      inFile + " (3000, 3) "s + (compression > 0 ? "6" : "None") + " True");
            EXPECT_NE(
                output("h5dump -d data -s 2999,0 -c 1,3 " + file).find("(2999,0): 107, 108, 109\n"),
                std::string::npos);
            EXPECT_EQ(replay<T>(type), values);
        }
    }

    const std::string file = testing::TempDir() + "recording-" + std::to_string(getpid()) + ".h5";
};

const std::string failed = "brenix:Device:failed|";

} // namespace

TEST_F(Hdf5Test, OthersReadWhatIsRecorded)
{
    expectWhatIsWritten<double>("double", "<f8");
    expectWhatIsWritten<float>("float", "<f4");
    expectWhatIsWritten<int8_t>("int8", "|i1");
    expectWhatIsWritten<int16_t>("int16", "<i2");
    expectWhatIsWritten<int32_t>("int32", "<i4");
    expectWhatIsWritten<int64_t>("int64", "<i8");
    expectWhatIsWritten<uint8_t>("uint8", "|u1");
    expectWhatIsWritten<uint16_t>("uint16", "<u2");
    expectWhatIsWritten<uint32_t>("uint32", "<u4");
    expectWhatIsWritten<uint64_t>("uint64", "<u8");
}

TEST_F(Hdf5Test, WhatStandsBesideTheCounts)
{
    Channel writer("hdf5");
    writer.start({{"FileName", file},
                  {"Mode", "write"},
                  {"Dataset", "run 1/force"},
                  {"Unit", "N"},
                  {"Names", "a\\,b"},
                  {"Origin", "signal Waveform=sine"},
                  {"Attributes", "operator=Ann,site=lab 3,note=\\,=\\\\ \u00e4"}});
    const auto before = std::chrono::system_clock::now();
    EXPECT_EQ(writer.write({1}), 1);
    EXPECT_EQ(writer.close(), 1);
    EXPECT_EQ(python("a = f['run 1/force'].attrs\n"
                     "print(*(v if k != 'start' else '' for k, v in sorted(a.items())), end='')"),
              "['a,b'] ,=\\ \u00e4 Ann signal Waveform=sine lab 3  N");
    Channel reader("hdf5");
    ASSERT_EQ(reader.init({{"FileName", file}, {"Dataset", "run 1/force"}}), 1) << reader.error();
    const auto start = std::chrono::nanoseconds(reader.property<int64_t>("Start", "int64"));
    EXPECT_GE(start, before.time_since_epoch());
    EXPECT_LE(start, std::chrono::system_clock::now().time_since_epoch());
    for (const auto& [name, text] :
         {std::pair("Unit", "N"),
          {"Names", "a\\,b"},
          {"Origin", "signal Waveform=sine"},
          {"Attributes", "note=\\,\\=\\\\ \u00e4,operator=Ann,site=lab 3"}}) {
        std::array<char, 100> value{};
        coderChannelGetPropertyValue(reader.handle, name, "char", value.size(), value.data());
        EXPECT_STREQ(value.data(), text) << name;
    }
}

TEST_F(Hdf5Test, WhatH5pyWroteIsRead)
{
    const auto expectRead = [this](auto zero, const char* type, const std::string& made) {
        SCOPED_TRACE(made);
        python("f.create_dataset('data', data=" + made + ")", "w");
        EXPECT_EQ(replay<decltype(zero)>(type), (std::vector<decltype(zero)>{-2, -1, 0, 1, 2}));
    };
    expectRead(int16_t(0), "int16", "n.arange(5, dtype='<i2') - 2");
    expectRead(0.0, "double", "(n.arange(5, dtype='>f8') - 2).reshape(5, 1)");
    expectRead(0.0F, "float", "n.arange(5, dtype='f2') - 2");
    expectRead(int64_t(0), "int64",
               "(n.arange(6, dtype='>i8') - 2)[:5], chunks=(2,), compression=9, shuffle=True");
    python("d = f.create_dataset('data', data=n.arange(6, dtype='>u2').reshape(2, 3))\n"
           "d.attrs.update(sample_rate=n.float32(2), unit=n.string_('V'), start=n.uint64(5), "
           "names=['x', 'y', 'z'], other=[1, 2])",
           "w");
    Channel reader("hdf5");
    EXPECT_EQ(replay<uint16_t>(reader, {"First", 1}, {"BlockSize", 1}, {"Stamps", 1}, "uint16"),
              (std::vector<uint16_t>{3, 4, 5}));
    EXPECT_EQ(reader.property<uint32_t>("Channels", "uint32"), 3);
    EXPECT_EQ(reader.property<double>("SampleRate", "double"), 2);
    int64_t time = 0;
    coderInputStreamReadBufferData(reader.input, 1, 0, "Time", "int64", 1, &time);
    EXPECT_EQ(time, 500000005);
}

TEST_F(Hdf5Test, GapsAreNotedAndToldAgain)
{
    constexpr int64_t start = 1700000000000000001; // no double has it
    constexpr int64_t ms = 1000000;
    Channel writer("hdf5");
    const auto init = [&] {
        return writer.init({{"FileName", file},
                            {"Mode", "write"},
                            {"Channels", 2},
                            {"SampleRate", 1000},
                            {"Start", start}});
    };
    const auto addGap = [&](int counts, int64_t after) {
        EXPECT_EQ(writer.execute("gap", {{"Counts", counts}, {"Time", start + after}}), 1)
            << writer.error();
    };
    ASSERT_EQ(init(), 1);
    EXPECT_EQ(writer.execute("gap", {{"Counts", 1}}), 0);
    EXPECT_EQ(writer.error(), unexpected + "A gap can only be noted while the channel is open.");
    ASSERT_EQ(writer.open(), 1);
    writer.write({0, 0, 1, 1});
    addGap(3, 5 * ms);
    writer.write({2, 2, 3});
    EXPECT_EQ(writer.execute("gap", {{"Counts", 1}}), 0);
    EXPECT_EQ(writer.error(), unexpected + "The last count before the gap has 1 of 2 elements.");
    writer.write({3});
    addGap(4, 100 * ms);
    writer.write({4, 4});
    addGap(2, 103 * ms);
    EXPECT_EQ(writer.property<uint64_t>("Gaps", "uint64"), 3);
    EXPECT_EQ(writer.close(), 1);
    EXPECT_EQ(python("print([(g[0], g[1] - " + std::to_string(start) +
                     ", g[2]) for g in f['data_gaps'][...].tolist()], end='')"),
              "[(2, 5000000, 3), (4, 100000000, 4), (5, 103000000, 2)]");

    for (const unsigned int first : {0U, 3U}) {
        Channel reader("hdf5");
        const Numbers all = {0, 0, 1, 1, 2, 2, 3, 3, 4, 4};
        EXPECT_EQ(replay(reader, {"First", int(first)}, {"BlockSize", 2}, {"Stamps", 1}),
                  Numbers(all.begin() + 2 * first, all.end()));
        const struct {
            uint64_t index;
            int64_t time;
        } buffers[] = {{0, 0}, {5, 5 * ms}, {6, 6 * ms}, {11, 100 * ms}};
        const auto* buffer = first == 0 ? buffers : buffers + 2;
        for (int32_t i = 1; i <= (first == 0 ? 3 : 2); ++i) {
            uint64_t index = 0;
            int64_t time = 0;
            coderInputStreamReadBufferData(reader.input, i, 0, "Index", "uint64", 1, &index);
            coderInputStreamReadBufferData(reader.input, i, 0, "Time", "int64", 1, &time);
            EXPECT_EQ(index, buffer->index);
            EXPECT_EQ(time - start, buffer->time);
            buffer += first == 0 && i == 2 ? 2 : 1;
        }
        EXPECT_EQ(reader.asyncError(),
                  "brenix:Stream:dataLost|2 counts were lost: the recording has a gap; " +
                      std::to_string(first == 0 ? 9 : 6) + " since open.");
    }
}

TEST_F(Hdf5Test, TheFileOfAKilledProgramOpens)
{
    for (int round = 0; round < 8; ++round) {
        SCOPED_TRACE(round);
        const bool isSlow = round < 2; // then all that was written is in the file after a while
        std::array<int, 2> ends{};
        ASSERT_EQ(pipe(ends.data()), 0);
        const pid_t child = fork();
        if (child == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL); // a test that fails leaves nobody behind
            Channel writer("hdf5", infinity, 100000);
            record(writer, {"Compression", round % 2 * 6}, {"SampleRate", round % 3 * 50000});
            for (double next = 0;; next += 1000) {
                writer.write(range(next, next + 1000));
                if (write(ends[1], "x", 1) != 1 || isSlow) {
                    pause();
                }
            }
        }
        close(ends[1]);
        char written = 0;
        for (int i = isSlow ? 0 : -20 * round; i <= 0 && read(ends[0], &written, 1) == 1; ++i) {
        }
        if (isSlow) {
            Channel::waitUntil([&] { return replay().size() == 1000; });
        }
        kill(child, SIGKILL);
        waitpid(child, nullptr, 0);
        close(ends[0]);
        const Numbers all = replay();
        EXPECT_EQ(all, range(0, double(all.size())));
        EXPECT_GE(all.size(), isSlow ? 1000U : 0U);
        EXPECT_EQ(
            python("print(len(f['data']), (f['data'][:, 0] == n.arange(len(f['data']))).all(), "
                   "len(f['data_gaps']), end='')"),
            std::to_string(all.size()) + " True 0");
        output("h5dump -H " + file);
        std::remove(file.c_str());
    }
}

TEST_F(Hdf5Test, WhatAFullDiskDoesNotTakeIsTold)
{
    rlimit before{};
    getrlimit(RLIMIT_FSIZE, &before);
    const std::string error = "Could not write " + file + ": File too large.";
    for (const rlim_t room : {100U, 300000U}) { // bytes that a file has room for
        const rlimit full{room, before.rlim_max};
        Channel writer("hdf5");
        writer.init({{"FileName", file}, {"Mode", "write"}, {"ElementType", "double"}});
        for (double next = 0; next < 100000; next += 10000) {
            EXPECT_EQ(writer.write(range(next, next + 10000)), 10000);
        }
        setrlimit(RLIMIT_FSIZE, &full);
        std::string told;
        if (writer.open() == 1) {
            told = writer.asyncError();
            writer.close();
        }
        setrlimit(RLIMIT_FSIZE, &before);
        if (room == 100) {
            EXPECT_EQ(writer.error(), unexpected + error);
            continue;
        }
        const std::size_t kept = replay().size();
        EXPECT_EQ(replay(), range(0, double(kept)));
        EXPECT_GT(kept, 30000); // of 37500
        EXPECT_EQ(told, failed + error + " " + std::to_string(100000 - kept) +
                            " elements were not taken.");
    }
}

TEST_F(Hdf5Test, WhatIsWrongIsSaid)
{
    python("f['text'] = ['a']\nf['cube'] = n.zeros((1, 1, 1))\nf['data'] = n.zeros(3)", "w");
    const std::string none = file + "-none";
    const struct {
        Option first, second;
        std::string error;
    } rows[] = {
        {{"FileName", ""}, {"Mode", "read"}, "Option FileName: must name an HDF5 file."},
        {{"FileName", file},
         {"Dataset", "text"},
         "The elements of dataset text of " + file + " are no numbers of an element type."},
        {{"FileName", file},
         {"Dataset", "cube"},
         "The dataset cube of " + file + " has 3 dimensions; 1 or 2 can be read."},
        {{"FileName", file},
         {"Dataset", "none"},
         "Could not open dataset none of " + file + ": object 'none' doesn't exist"},
        {{"FileName", file},
         {"First", 4},
         "Option First: must be at most 3, the counts of " + file + "."},
        {{"FileName", file},
         {"Pace", "realtime"},
         "Option Pace: needs SampleRate: " + file + " does not tell it."},
        {{"FileName", none},
         {"Mode", "read"},
         "Could not open " + none + ": No such file or directory"},
        {{"FileName", "/dev/null"},
         {"Mode", "read"},
         "Could not open /dev/null: it is no regular file"},
        {{"FileName", "/proc/self/exe"},
         {"Mode", "read"},
         "Could not open /proc/self/exe: file signature not found"},
        {{"Mode", "write"},
         {"Attributes", "site"},
         "Option Attributes: must be of the form name=value,name=value, not site."},
        {{"Mode", "write"},
         {"Attributes", "unit=V"},
         "Option Attributes: has the name of an attribute with its own option: unit."},
        {{"Mode", "write"}, {"Attributes", "a=1,a=2"}, "Option Attributes: has two of the name a."},
        {{"Mode", "write"},
         {"Names", "a,b"},
         "Option Names: must be 1, one for each of the Channels, not 2."},
    };
    for (const auto& [first, second, error] : rows) {
        Channel channel("hdf5");
        EXPECT_EQ(first.name == "FileName"s ? channel.init({first, second})
                                            : channel.init({first, second, {"FileName", file}}),
                  0);
        EXPECT_EQ(channel.error(), unexpected + error);
    }

    const auto expectChanged = [this](Option first, const char* made, const std::string& error) {
        python("f.create_dataset('data', data=n.zeros(3))", "w");
        Channel reader("hdf5");
        ASSERT_EQ(reader.init({{"FileName", file}, first}), 1) << reader.error();
        python(made, "w");
        EXPECT_EQ(reader.open(), 0) << made;
        EXPECT_EQ(reader.error(), unexpected + error);
    };
    const std::string other =
        "Could not open " + file + ": its dataset data has changed since init";
    expectChanged({"First", 3}, "f['data'] = n.zeros(2)",
                  "Option First: must be at most 2, the counts of " + file + ".");
    expectChanged({"First", 0}, "f['data'] = n.zeros((3, 2))", other);
    expectChanged({"First", 0}, "f['data'] = n.zeros(3, dtype='<f4')", other);

    Channel writer("hdf5");
    record(writer, {"Channels", 2});
    Channel second("hdf5");
    second.init({{"FileName", file}, {"Mode", "write"}});
    EXPECT_EQ(second.open(), 0);
    EXPECT_EQ(second.error(),
              unexpected + "Could not open " + file + ": another recording writes it");
    const float wrong = 1;
    double written = 0;
    coderOutputStreamWriteTypedDataOld(writer.output, &written, 1, "float",
                                       CODER_BUFFER(1, &wrong));
    const std::string refused =
        "1 counts were not written to " + file + ": elements must be double, not float.";
    EXPECT_EQ(writer.asyncError(), "brenix:Device:wrongType|" + refused);
    writer.write({1, 2, 3});
    EXPECT_EQ(writer.close(), 1);
    EXPECT_EQ(writer.asyncError(), failed + "The last count for " + file +
                                       " has 1 of 2 elements and was not written. " + refused);
    EXPECT_EQ(replay(), (Numbers{1, 2}));
}

TEST_F(Hdf5Test, ReplayKeepsThePaceAndClosesAtOnce)
{
    std::thread([this] { // also on a thread that ends when the device is gone
        Channel writer("hdf5");
        record(writer);
        writer.write(range(0, 1000));
        EXPECT_EQ(writer.close(), 1);
    })
        .join();
    Channel reader("hdf5");
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(replay(reader, {"Pace", "realtime"}, {"SampleRate", 10000}).size(), 1000);
    EXPECT_EQ(reader.error(coderChannelGetLastAsyncError), "|");
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(100));
    reader.close();
    reader.start({{"FileName", file}, {"Pace", "realtime"}, {"SampleRate", 1e-9}});
    EXPECT_EQ(reader.close(), 1);
}
