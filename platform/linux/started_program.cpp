#include "platform/linux/started_program.h"

#include <array>
#include <csignal>
#include <filesystem>
#include <system_error>

#include <fcntl.h>
#include <spawn.h>
#include <unistd.h>

// The caller has threads, so the program is spawned, not forked. It gets the socket and nothing else: no
// environment, no other descriptor, no signal setting, and a session of its own, so that no Ctrl-C ends it.

namespace typhon {

namespace {

struct FileActions {
    posix_spawn_file_actions_t actions;
    FileActions() { ::posix_spawn_file_actions_init(&actions); }
    ~FileActions() { ::posix_spawn_file_actions_destroy(&actions); }
    FileActions(const FileActions&) = delete;
    FileActions& operator=(const FileActions&) = delete;
};

struct SpawnAttributes {
    posix_spawnattr_t attributes;
    SpawnAttributes()
    {
        ::posix_spawnattr_init(&attributes);
        sigset_t all;
        sigset_t none;
        ::sigfillset(&all);
        ::sigemptyset(&none);
        ::posix_spawnattr_setsigdefault(&attributes, &all);
        ::posix_spawnattr_setsigmask(&attributes, &none);
        ::posix_spawnattr_setflags(&attributes,
                                   POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSID);
    }
    ~SpawnAttributes() { ::posix_spawnattr_destroy(&attributes); }
    SpawnAttributes(const SpawnAttributes&) = delete;
    SpawnAttributes& operator=(const SpawnAttributes&) = delete;
};

}  // namespace

pid_t startProgram(const std::string& program, int control)
{
    FileActions files;
    ::posix_spawn_file_actions_adddup2(&files.actions, control, STDIN_FILENO);
    ::posix_spawn_file_actions_addopen(&files.actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    ::posix_spawn_file_actions_addopen(&files.actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
    ::posix_spawn_file_actions_addclosefrom_np(&files.actions, STDERR_FILENO + 1);
    const SpawnAttributes attributes;
    std::string name = program;
    std::array<char*, 2> arguments{name.data(), nullptr};
    std::array<char*, 1> environment{nullptr};
    pid_t process = -1;
    const int error = ::posix_spawn(&process, program.c_str(), &files.actions, &attributes.attributes,
                                    arguments.data(), environment.data());
    return error == 0 ? process : -error;
}

std::optional<std::string> installedProgram(const std::string& name)
{
    std::error_code error;
    const auto own = std::filesystem::read_symlink("/proc/self/exe", error).parent_path();
    // Beside this program, where both were installed together, or on the system.
    for (const auto& folder :
         {own, own / "../libexec/typhon", std::filesystem::path("/usr/libexec/typhon")}) {
        auto candidate = (folder / name).string();
        if (!folder.empty() && ::access(candidate.c_str(), X_OK) == 0) {
            return candidate;
        }
    }
    return std::nullopt;
}

}  // namespace typhon
