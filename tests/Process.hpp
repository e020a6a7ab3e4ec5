// A program that a test starts and ends.
#ifndef BRENIXCODER_TESTS_PROCESS_HPP
#define BRENIXCODER_TESTS_PROCESS_HPP

#include <csignal>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace driver
{

class Process
{
public:
    explicit Process(const std::string& command) : id(fork())
    {
        if (id == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL); // also when the test is killed
            execl("/bin/sh", "sh", "-c", ("exec " + command).c_str(), nullptr);
            _exit(127);
        }
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;
    ~Process() { end(); }

    void end()
    {
        if (id > 0) {
            kill(id, SIGKILL);
            waitpid(id, nullptr, 0);
            id = 0;
        }
    }

    pid_t id;
};

} // namespace driver

#endif
