#pragma once

#include "fontmanager/font_names.h"
#include "fontmanager/provider_directories.h"
#include "fontmanager/registry_writer.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Reads the names in an open font file, or says why there are none.
using ReadFontNames = std::function<FontNamesReading(int descriptor)>;

/// What one registration may cost.
struct RegistrationLimits {
    std::size_t files = 4096;
    std::uint64_t fileBytes = FontLimits{}.bytes;
    std::uint64_t allBytes = std::uint64_t(4) << 30;
};

/// A file that was copied beside its place and read, and only needs to be renamed.
struct StagedFont {
    /// Its present name, in the directory of its path.
    std::string temporary;
    RegisteredFont font;
};

/// The files of one registration, copied and read one after another but not in their places yet. What is not
/// taken out of it is removed with it. One thread at a time.
class FontRegistration {
public:
    /// What the names of copies begin with. No font file's does.
    static constexpr const char* temporaryPrefix = ".installing-";

    /// `serial` tells the registrations of one process apart. `lease` is the provider's directory.
    FontRegistration(std::unique_ptr<ProviderDirectories::Lease> lease, bool enabled, std::uint64_t serial,
                     ReadFontNames readNames, RegistrationLimits limits = {});
    FontRegistration(const FontRegistration&) = delete;
    FontRegistration& operator=(const FontRegistration&) = delete;
    ~FontRegistration();

    /// Takes a file, to be installed under that name: copies it, and begins to read the names of the copy.
    /// `file` may be anything that somebody passed; it stays the caller's and its offset is not used. Null,
    /// or why this file or one before it is refused, with its name; then the registration is of no use any
    /// more.
    std::optional<std::string> add(const std::string& name, int file);

    /// Waits until all names are read and all copies on the disk, where flushing all of them is cheaper than
    /// each. Null, or why not, with the file's name. Before that the names in `fonts` are not there. Calling
    /// it again costs nothing.
    std::optional<std::string> finish();

    const std::vector<StagedFont>& fonts() const { return fonts_; }
    /// Leaves the copies to whoever puts them in their places.
    void release() { fonts_.clear(); }
    int directory() const { return lease_->descriptor(); }

private:
    struct Reading {
        std::size_t font = 0;
        std::future<FontNamesReading> names;
    };

    std::optional<std::string> takeNames();
    std::string nameOf(const StagedFont& staged) const;
    std::optional<std::string> stage(const std::string& name, int file);
    std::optional<std::string> copy(int from, int to);

    const std::unique_ptr<ProviderDirectories::Lease> lease_;
    const bool enabled_;
    const std::uint64_t serial_;
    const ReadFontNames readNames_;
    const RegistrationLimits limits_;
    std::vector<StagedFont> fonts_;
    std::set<std::string> names_;
    std::uint64_t bytes_ = 0;
    /// How many of the fonts' copies are on the disk.
    std::size_t flushed_ = 0;
    /// Those under way, in order. Last: they end before what they use.
    std::deque<Reading> readings_;
};

}  // namespace typhon
