#pragma once

#include <functional>

#include <sys/types.h>

namespace typhon::bench {

/// A process of our own that is killed with its object.
class Child {
public:
    Child() = default;
    /// Forks and runs `body` in the child, which then ends.
    explicit Child(const std::function<void()>& body);
    Child(Child&& other) noexcept;
    Child& operator=(Child&& other) noexcept;
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() { kill(); }

    pid_t pid() const { return pid_; }
    /// Kills it, if it is there, and waits for its end.
    void kill();

private:
    pid_t pid_ = -1;
};

/// What a process occupies of memory that it shares with nobody, in bytes.
double privateBytesOf(pid_t process);

}  // namespace typhon::bench
