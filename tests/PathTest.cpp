#include "scripted/ChannelFixture.hpp"

#include <filesystem>
#include <fstream>

#include <stdlib.h>

using namespace scripted;
namespace fs = std::filesystem;

TEST(PathTest, PathsBecomeCanonicalOrEmpty)
{
    const fs::path start = fs::current_path();
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
    // Directories one below the other, the last such that its path has 4095 bytes.
    std::string longest = home;
    while (longest.size() < 4095) {
        const std::size_t left = 4095 - longest.size() - 1;
        longest.append(1, '/').append(left <= 200 ? left : left < 302 ? 100 : 200, 'x');
        fs::create_directory(longest.substr(longest.rfind('/') + 1));
        fs::current_path(longest.substr(longest.rfind('/') + 1));
    }
    fs::create_directory("y");
    fs::current_path(home);
    const std::pair<std::string, std::string> rows[] = {
        {home + "/./sub/../file", home + "/file"},
        {".", home},
        {"sub/dir/../..//file", home + "/file"},
        {"link/..", home + "/sub"},
        {beyondAscii, home + "/" + beyondAscii},
        {longest, longest},
        {longest + "/y", ""},
        {"missing", ""},
        {"file/x", ""},
        {"loop", ""},
        {"", ""},
        {"a\xFF", ""},
    };
    for (const auto& [path, expected] : rows) {
        Buffer buffer(CODER_PATH_SIZE);
        coderComputeAbsolutePath(path.c_str(), buffer.data());
        EXPECT_EQ(buffer.text(), expected) << path;
    }
    Buffer buffer(CODER_PATH_SIZE);
    coderComputeAbsolutePath(nullptr, buffer.data());
    coderComputeAbsolutePath("file", nullptr);
    EXPECT_EQ(buffer.text(), "");
    fs::current_path(start);
    fs::remove_all(home);
}
