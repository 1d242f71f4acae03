#pragma once

#include "platform/linux/root_directory.h"
#include "platform/property_list.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// One installed font file, as the registry records it.
struct RegisteredFont {
    /// Absolute logical path.
    std::string path;
    /// PostScript name to family name, one pair a face.
    std::map<std::string, std::string> familyNames;
    bool disabled = false;
};

/// Adds a font to the registry's entries, or replaces the names and state of one that is there. Null, or why
/// it cannot be recorded.
std::optional<std::string> putFont(PropertyList::Dictionary& entries, const RegisteredFont& font);

/// Changes /var/mobile/Library/UserFonts/UserFonts.plist. The file is replaced as a whole, atomically and
/// flushed to disk, under a lock that excludes every other writer, so that a reader sees the state before or
/// after a change and no change is lost. Entries and keys it does not know are carried over. A malformed
/// registry is never replaced: every change fails until somebody has looked at it.
///
/// Operations return null, or why they failed; then nothing has changed. Any thread; they block on the disk.
class RegistryWriter {
public:
    enum class Format { binary, xml };

    explicit RegistryWriter(RootDirectory root, Format format = Format::binary);

    /// Adds these fonts, or replaces the names and state of those already there.
    std::optional<std::string> add(const std::vector<RegisteredFont>& fonts);
    /// Removes the entries of these paths; those that are not there are none the less gone.
    std::optional<std::string> remove(const std::vector<std::string>& paths);
    /// Switches the font at each path off or on. Fails when one is not registered.
    std::optional<std::string> setDisabled(const std::vector<std::string>& paths, bool disabled);

    /// Any other change, in one step with its reading: `change` edits the entries, and returns null or why
    /// nothing is to be written.
    using Change = std::function<std::optional<std::string>(PropertyList::Dictionary& entries)>;
    /// `beforeReplacing` runs once the changed registry is on the disk, flushed, and only needs to take its
    /// place; an error of it leaves the old one there. Without it, a change that changes nothing is not
    /// written.
    using Step = std::function<std::optional<std::string>()>;
    std::optional<std::string> update(const Change& change, const Step& beforeReplacing = {});

    /// True from when a registry takes its place until `wasReported`, also in later runs: the one that wrote
    /// it may have been killed before it told anybody.
    bool isUnreported() const;
    void wasReported();

private:
    std::optional<std::string> markUnreported() const;

    const RootDirectory root_;
    const Format format_;
};

}  // namespace typhon
