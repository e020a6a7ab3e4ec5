#include "scripted/ChannelFixture.hpp"

#include <filesystem>
#include <fstream>

#include <stdlib.h>

using namespace scripted;
namespace fs = std::filesystem;

TEST(PathTest, PathsBecomeCanonicalOrEmpty)
{
    std::string home = fs::canonical(fs::temp_directory_path()) / "pathXXXXXX";
    ASSERT_NE(mkdtemp(home.data()), nullptr);
    fs::current_path(home);
    fs::create_directories("sub/dir");
    fs::create_symlink("sub/dir", "link");
    fs::create_symlink("loop", "loop");
    const std::string beyondAscii = "\xC3\xA9\xE6\x97\xA5\xF0\x9F\x98\x80";
    for (const std::string& name : {"file"s, beyondAscii, "a\xFF"s}) {
        std::ofstream(name) << name;
    }
    // A path of 4095 bytes, and one that is longer but can be named by a short one.
    std::string longest = home;
    while (longest.size() < 3895) {
        longest.append("/").append(100, 'x');
    }
    longest += '/';
    longest.append(4095 - longest.size(), 'x');
    fs::create_directories(longest);
    fs::create_symlink(longest, "longest");
    fs::create_directory("longest/y");
    const std::pair<std::string, std::string> rows[] = {
        {home + "/./sub/../file", home + "/file"},
        {".", home},
        {"sub/dir/../..//file", home + "/file"},
        {"link/..", home + "/sub"},
        {beyondAscii, home + "/" + beyondAscii},
        {longest, longest},
        {"longest/y", ""},
        {"missing", ""},
        {"file/x", ""},
        {"loop", ""},
        {"", ""},
        {"a\xFF", ""},
    };
    for (const auto& [path, expected] : rows) {
        Buffer buffer(CODER_PATH_SIZE);
        coderComputeAbsolutePath(path.c_str(), buffer);
        EXPECT_EQ(buffer.text(), expected) << path;
    }
    Buffer buffer(CODER_PATH_SIZE);
    coderComputeAbsolutePath(nullptr, buffer);
    coderComputeAbsolutePath("file", nullptr);
    EXPECT_EQ(buffer.text(), "");
    fs::current_path("/");
    fs::remove_all(home);
}
