#include "Trace.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <new>
#include <string_view>
#include <system_error>
#include <utility>

namespace brenixcore
{

Trace::Trace(std::string deviceName) : device(std::move(deviceName))
{
    const char* const name = std::getenv("BRENIX_TRACE");
    if (name == nullptr || *name == '\0') {
        return;
    }
    file = std::string_view(name) == "stderr"
               ? STDERR_FILENO
               : ::open(name, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0666);
    if (file == -1) {
        std::fprintf(stderr, "BRENIX_TRACE: %s: %s\n", name,
                     std::generic_category().message(errno).c_str());
    }
}

Trace::~Trace()
{
    if (file > STDERR_FILENO) {
        ::close(file);
    }
}

void Trace::write(const char* event, const char* identifier, const char* message) const noexcept
{
    if (file != -1) {
        try {
            writeLine(event, identifier, message);
        } catch (const std::bad_alloc&) {
        }
    }
}

void Trace::writeLine(const char* event, const char* identifier, const char* message) const
{
    using std::chrono::system_clock;
    const auto now = system_clock::now();
    const std::time_t seconds = system_clock::to_time_t(now);
    std::tm utc{};
    std::array<char, 32> date{};
    std::strftime(date.data(), date.size(), "%Y-%m-%dT%H:%M:%S", ::gmtime_r(&seconds, &utc));
    std::array<char, 96> start{};
    std::snprintf(start.data(), start.size(), "%s.%06ldZ thread %d ", date.data(),
                  std::chrono::duration_cast<std::chrono::microseconds>(
                      now - system_clock::from_time_t(seconds))
                      .count(),
                  ::gettid());
    std::string line = start.data() + device + ' ' + event + ' ' + identifier + ": " + message;
    std::replace_if(
        line.begin(), line.end(), [](unsigned char byte) { return byte < ' '; }, ' ');
    line += '\n';
    // In one piece, between those of other channels; a full disk is no reason to fail.
    [[maybe_unused]] const auto written = ::write(file, line.data(), line.size());
}

} // namespace brenixcore
