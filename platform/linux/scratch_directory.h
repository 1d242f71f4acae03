#pragma once

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>

namespace typhon {

/// A new folder that is removed with its contents in the end. For tests and for tools that try things out.
class ScratchDirectory {
public:
    ScratchDirectory() : path_((std::filesystem::temp_directory_path() / "typhon-XXXXXX").string())
    {
        if (::mkdtemp(path_.data()) == nullptr) {
            throw std::runtime_error("cannot make a scratch directory like " + path_);
        }
    }
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;
    ~ScratchDirectory()
    {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    /// Absolute, without a final "/".
    const std::string& path() const { return path_; }
    /// The real path of something in it; `below` begins with "/".
    std::string real(std::string_view below) const { return path_ + std::string(below); }

    /// Makes or replaces a file, with the directories above it.
    void writeFile(std::string_view below, std::string_view contents) const
    {
        const std::filesystem::path file = real(below);
        std::filesystem::create_directories(file.parent_path());
        std::ofstream(file, std::ios::binary) << contents;
    }
    /// The contents of a file; empty when there is none.
    std::string readFile(std::string_view below) const
    {
        std::ifstream file(real(below), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    }

private:
    std::string path_;
};

}  // namespace typhon
