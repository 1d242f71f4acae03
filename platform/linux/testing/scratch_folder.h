#pragma once

// A scratch system on disk for tests.

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/signing.h"
#include "platform/log.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <mutex>
#include <stdexcept>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon::testing {

/// A folder that is removed at the end, and the system whose root it is.
class ScratchFolder {
public:
    ScratchFolder()
    {
        std::string name = std::filesystem::temp_directory_path() / "typhon-unit-XXXXXX";
        if (::mkdtemp(name.data()) == nullptr || ::chmod(name.c_str(), 0755) != 0) {
            throw std::runtime_error("no scratch folder");
        }
        path = name;
        root = RootDirectory(name);
    }
    ScratchFolder(const ScratchFolder&) = delete;
    ScratchFolder& operator=(const ScratchFolder&) = delete;
    ~ScratchFolder()
    {
        std::error_code ignored;
        std::filesystem::remove_all(path, ignored);
    }

    /// Writes a file at a logical path, with the directories above it; gives its real path.
    std::string write(const std::string& logicalPath, const std::string& contents, mode_t mode = 0644) const
    {
        const auto real = root.real(logicalPath);
        std::filesystem::create_directories(std::filesystem::path(real).parent_path());
        std::ofstream(real, std::ios::binary | std::ios::trunc) << contents;
        ::chmod(real.c_str(), mode);
        return real;
    }

    /// A copy of cat with contents of its own.
    std::string program(const std::string& name) const
    {
        const auto real = root.real("/" + name);
        std::filesystem::copy_file("/bin/cat", real, std::filesystem::copy_options::overwrite_existing);
        std::ofstream(real, std::ios::binary | std::ios::app) << "\n" << name;
        ::chmod(real.c_str(), 0755);
        return real;
    }

    std::string path;
    RootDirectory root;
};

inline Sha256 digestOf(const std::string& path)
{
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    return sha256OfFile(file.get()).value();
}

/// Remembers what was logged.
class RecordingLog : public Log {
public:
    void write(LogSink, LogLevel, std::string_view message) override
    {
        const std::lock_guard lock(mutex_);
        lines_.emplace_back(message);
    }
    std::vector<std::string> lines() const
    {
        const std::lock_guard lock(mutex_);
        return lines_;
    }
    bool has(std::string_view text) const
    {
        for (const auto& line : lines()) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }

private:
    mutable std::mutex mutex_;
    std::vector<std::string> lines_;
};

}  // namespace typhon::testing
