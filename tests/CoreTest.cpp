// The embedded core through its own classes: what the C functions do not show.

#include "Handed.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <unistd.h>

#include <filesystem>
#include <fstream>

using namespace handed;

namespace
{

const std::string testPlugins = TEST_PLUGINS "/";
const std::string folder = PLUGINS "/"; // where bare names are looked for

bool isLoaded(const std::string& path)
{
    void* const library = dlopen(path.c_str(), RTLD_NOW | RTLD_NOLOAD);
    if (library != nullptr) {
        dlclose(library);
    }
    return library != nullptr;
}

} // namespace

TEST(LoadTest, ErrorsSayWhatWasTriedAndWhy)
{
    const std::string files = testing::TempDir() + "core-" + std::to_string(getpid()) + "/";
    std::filesystem::create_directory(files);
    const std::string text = files + "longText.so";
    std::ofstream(text) << "This is a text and not a shared library, though it is as long as one.";
    std::ifstream probeFile(testPlugins + "probe.so", std::ios::binary);
    std::string bytes(std::istreambuf_iterator<char>(probeFile), {});
    const std::string cut = files + "cut.so";
    std::ofstream(cut, std::ios::binary) << bytes.substr(0, 9000); // in the middle of its code
    const std::string dependency = "libstdc++.so.6";
    const std::string lacking = files + "lacking.so";
    std::ofstream(lacking, std::ios::binary)
        << bytes.replace(bytes.find(dependency), dependency.size(), "libabsent.so.6");
    const std::string empty = files + "empty.so";
    std::ofstream(empty) << "";
    const auto test = [](const std::string& name) { return testPlugins + name + ".so"; };
    const std::string missing = ": cannot open shared object file: No such file or directory";
    const struct {
        std::string device, why;
        bool isCreated = false;
    } rows[] = {
        {"none", folder + "none.so" + missing},
        {"./none.so", "./none.so" + missing},
        {text, text + ": invalid ELF header"},
        {empty, empty + ": file too short"},
        {folder, "it is not a regular file"},
        {"/dev/zero", "it is not a regular file"},
        {cut, "the file is cut short"},
        {lacking, "libabsent.so.6" + missing},
        {test("throwsWhileLoading"), "thrown while loading"},
        {test("otherAbiVersion"), "it has plug-in ABI version 999, needed is 3"},
        {test("throwingStatic"), "thrown by a static object"},
        {test("throwingStatic"), "thrown by a static object"}, // half loaded is not loaded
        {"identity", "it is a converter and no device", true},
        {test("noFactory"),
         "it exports none of brenixcoreCreateDevice, brenixcoreCreateConverter and "
         "brenixcoreCreateFilter",
         true},
        {test("throwingFactory"), "thrown by the factory", true},
        {test("throwingInt"), "Unrecognized error.", true},
        {test("nullFactory"), "the factory returned nothing", true},
    };
    brenixcore::Converter converter("identity");
    Log log;
    for (const auto& [device, why, isCreated] : rows) {
        const bool isBare = device.find('/') == std::string::npos;
        const std::string path = isBare ? folder + device + ".so" : device;
        try {
            const brenixcore::Channel channel(device, converter, log, 1, 1);
            ADD_FAILURE() << device;
        } catch (const std::runtime_error& exception) {
            EXPECT_EQ(dynamic_cast<const brenixcore::CouldNotCreateDevice*>(&exception) != nullptr,
                      isCreated);
            EXPECT_EQ(exception.what(),
                      (isCreated ? "Could not create " : "Could not load ") + path + ": " + why);
        }
        EXPECT_FALSE(isLoaded(device)) << device;
    }
    std::filesystem::remove_all(files);
}

TEST(LoadTest, PluginsAreUnloaded)
{
    int plugins = 0;
    for (const auto& entry : std::filesystem::directory_iterator(folder)) {
        void* const library = dlopen(entry.path().c_str(), RTLD_NOW | RTLD_LOCAL);
        EXPECT_NE(library, nullptr) << dlerror();
        dlclose(library);
        const auto stem = entry.path().stem(); // plugins/CMakeLists.txt says why some stay
        const bool stays = stem == "alsa" || stem == "gstreamer" || stem == "hdf5" ||
                           stem == "nats" || stem == "soapy";
        EXPECT_EQ(isLoaded(entry.path()), stays) << entry.path();
        ++plugins;
    }
    EXPECT_GT(plugins, 0);
}

TEST(DataTest, MovesByPointerFromDeviceToCaller)
{
    Rig rig({StreamInfo{}, std::nullopt}, UINT64_MAX);
    rig.init();
    rig.open();
    const void* address = nullptr;
    rig.device->perform([&](DeviceStreams& streams) {
        Packet packet;
        number(packet, 0, 1000);
        address = dataOf(*packet.fields).data;
        streams.push(std::move(packet));
    });
    std::vector<void*> buffers;
    std::uint64_t total = 0;
    rig.input->read(1000, buffers, total);
    ASSERT_EQ(buffers.size(), 1);
    const brenixplugin::OwnedDataBuffer buffer(static_cast<PropertyMap*>(buffers[0]));
    EXPECT_EQ(dataOf(*buffer).data, address);
}

TEST(DataTest, WriteLeavesTheBuffersToTheCaller)
{
    const std::string loopback = folder + "loopback.so";
    {
        brenixcore::Converter converter("identity");
        Log log;
        brenixcore::Channel channel(loopback, converter, log, UINT64_MAX, UINT64_MAX);
        PropertyMap properties;
        channel.init({}, properties);
        channel.open({});
        Packet packet;
        number(packet, 3, 2);
        void* const written = &*packet.fields;
        EXPECT_EQ(channel.getOutputStream()->write({written, written}), 4);
        std::vector<void*> buffers;
        std::uint64_t total = 0;
        channel.getInputStream()->read(4, buffers, total);
        ASSERT_EQ(buffers.size(), 2);
        for (void* const buffer : buffers) {
            const brenixplugin::OwnedDataBuffer owned(static_cast<PropertyMap*>(buffer));
            const auto& data = dataOf(*owned);
            EXPECT_EQ(Counts(data.data, data.data + data.count), (Counts{3, 4}));
        }
        brenixplugin::releaseProperties(properties);
    }
    EXPECT_FALSE(isLoaded(loopback));
}

TEST(VisitTest, FindsTheClassOrOneItIsDerivedFrom)
{
    using Vector = brenixplugin::kit::device::TVectorProperty<signed char>;
    struct Derived : Vector {
        using Vector::Vector;
    };
    struct Own : brenixplugin::interfaces::IPropertyInfo {
        const char* getName() const override { return "own"; }
        void destroy() override {}
    };
    Vector vector("v", 3);
    Derived derived("d", 2);
    Own own;
    const std::pair<brenixplugin::interfaces::IPropertyInfo*, std::size_t> rows[] = {
        {&vector, 3}, {&derived, 2}, {&own, 0}, {nullptr, 0}};
    for (const auto& [property, size] : rows) {
        std::size_t found = 0;
        const auto visitor = [&](auto& visited) {
            if constexpr (std::is_same_v<decltype(visited), Vector&>) {
                found = visited.values.size();
            }
        };
        EXPECT_EQ(visitProperty(property, visitor), size > 0);
        EXPECT_EQ(found, size);
    }
}
