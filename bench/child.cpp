#include "child.h"

#include <csignal>
#include <fstream>
#include <stdexcept>
#include <string>
#include <utility>

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon::bench {

Child::Child(const std::function<void()>& body) : pid_(::fork())
{
    if (pid_ < 0) {
        throw std::runtime_error("cannot fork");
    }
    if (pid_ == 0) {
        ::prctl(PR_SET_PDEATHSIG, SIGKILL);
        body();
        ::_exit(0);
    }
}

Child::Child(Child&& other) noexcept : pid_(std::exchange(other.pid_, -1)) {}

Child& Child::operator=(Child&& other) noexcept
{
    std::swap(pid_, other.pid_);
    return *this;
}

void Child::kill()
{
    if (pid_ > 0) {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
        pid_ = -1;
    }
}

double privateBytesOf(pid_t process)
{
    std::ifstream rollup("/proc/" + std::to_string(process) + "/smaps_rollup");
    double bytes = 0;
    for (std::string word; rollup >> word;) {
        if (word == "Private_Clean:" || word == "Private_Dirty:") {
            double kilobytes = 0;
            rollup >> kilobytes;
            bytes += kilobytes * 1024;
        }
    }
    return bytes;
}

}  // namespace typhon::bench
