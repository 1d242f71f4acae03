#include "tools/host_files.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

namespace typhon {

namespace fs = std::filesystem;

HostFiles::Kind LinuxHostFiles::kind(const std::string& path) const
{
    std::error_code error;
    switch (fs::symlink_status(path, error).type()) {
    case fs::file_type::none:
    case fs::file_type::not_found:
        return Kind::missing;
    case fs::file_type::directory:
        return Kind::directory;
    case fs::file_type::regular:
        return Kind::file;
    case fs::file_type::symlink:
        return Kind::symbolicLink;
    default:
        return Kind::other;
    }
}

std::string LinuxHostFiles::linkTarget(const std::string& path) const
{
    std::error_code error;
    return fs::read_symlink(path, error).string();
}

std::optional<std::vector<std::string>> LinuxHostFiles::names(const std::string& directory) const
{
    std::error_code error;
    std::vector<std::string> names;
    for (fs::directory_iterator entry(directory, error); !error && entry != fs::directory_iterator();
         entry.increment(error)) {
        names.push_back(entry->path().filename().string());
    }
    if (error) {
        return std::nullopt;
    }
    std::sort(names.begin(), names.end());
    return names;
}

std::string LinuxHostFiles::resolved(const std::string& path) const
{
    std::error_code error;
    const auto found = fs::weakly_canonical(fs::absolute(path), error);
    auto text = error ? fs::absolute(path).lexically_normal().string() : found.string();
    while (text.size() > 1 && text.back() == '/') {
        text.pop_back();
    }
    return text;
}

}  // namespace typhon
