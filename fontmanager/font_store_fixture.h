#pragma once

// A store in a scratch folder, for tests. Font files are texts; the names in them are what they say.

#include "fontmanager/font_paths.h"
#include "fontmanager/font_store.h"
#include "platform/file_system.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/scratch_directory.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <map>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

namespace typhon::test_store {

class KeptLog : public Log {
public:
    void write(LogSink, LogLevel, std::string_view message) override
    {
        const std::lock_guard lock(mutex_);
        lines_.emplace_back(message);
    }
    bool has(std::string_view text) const
    {
        const std::lock_guard lock(mutex_);
        return std::ranges::any_of(lines_, [&](const auto& line) { return line.find(text) != line.npos; });
    }

private:
    mutable std::mutex mutex_;
    std::vector<std::string> lines_;
};

/// A file with that text, for reading.
inline FileDescriptor fileWith(const std::string& text)
{
    FileDescriptor file(::memfd_create("font", MFD_CLOEXEC));
    EXPECT_EQ(::write(file.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
    return file;
}

/// A font file holds "font NAME"; anything else is none.
inline FontNamesReading readText(int file)
{
    std::array<char, 256> buffer{};
    const auto count = ::pread(file, buffer.data(), buffer.size(), 0);
    const std::string text(buffer.data(), count > 0 ? static_cast<std::size_t>(count) : 0);
    if (!text.starts_with("font ")) {
        return {.familyNames = {}, .error = "not a font"};
    }
    return {.familyNames = std::map<std::string, std::string>{{text.substr(5), "Family"}}, .error = ""};
}

inline const std::string directory = std::string(font_paths::fontFiles) + "org.example.a";

class FontStoreFixture : public testing::Test {
protected:
    FontStoreFixture() { EXPECT_EQ(store.open().error, std::nullopt); }

    RegistryChangeOutcome install(const std::string& identifier, const std::vector<std::string>& names,
                                  const std::string& text = "font X", bool enabled = true)
    {
        auto begun = store.begin(identifier, enabled);
        if (!begun.registration) {
            return {.change = {}, .error = begun.error};
        }
        for (const auto& name : names) {
            if (auto error = begun.registration->add(name, fileWith(text).get())) {
                return {.change = {}, .error = std::move(error)};
            }
        }
        return store.commit(*begun.registration);
    }
    PropertyList registry() const
    {
        auto reading = LinuxFileSystem(root).readPropertyList(font_paths::registry);
        return reading.value ? *reading.value : PropertyList();
    }
    /// Every file below the providers' directories, as logical paths, sorted, and every empty directory.
    std::vector<std::string> files() const
    {
        std::vector<std::string> found;
        for (const auto& entry :
             std::filesystem::recursive_directory_iterator(root.real(font_paths::fontFiles))) {
            const bool isFull = entry.is_directory() && !entry.is_symlink() && !is_empty(entry.path());
            if (!isFull) {
                found.push_back(entry.path().string().substr(root.directory().size()));
            }
        }
        std::ranges::sort(found);
        return found;
    }
    bool isThere(const std::string& path) const { return std::filesystem::exists(root.real(path)); }

    ScratchDirectory scratch;
    KeptLog log;
    RootDirectory root{scratch.path()};
    FontStore store{root, readText, log};
};

}  // namespace typhon::test_store
