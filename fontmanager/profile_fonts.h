#pragma once

#include "fontmanager/font_registration.h"
#include "fontmanager/font_store.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <mutex>

namespace typhon {

/// The record of the fonts under /var/mobile/Library/Fonts/Managed/, which others put there. It holds an
/// entry for each of them that can be read and named. Any thread; blocks on the disk.
class ProfileFonts {
public:
    /// `log` outlives this.
    ProfileFonts(RootDirectory root, ReadFontNames readNames, Log& log)
        : root_(std::move(root)), readNames_(std::move(readNames)), log_(log)
    {}

    /// Brings the record in step with the files, and tells what changed: a font with other names counts as
    /// available again. A file that is no good font is logged and left out.
    RegistryChangeOutcome synchronize();

private:
    PropertyList::Dictionary readFonts();

    const RootDirectory root_;
    const ReadFontNames readNames_;
    Log& log_;
    /// One synchronisation at a time.
    std::mutex mutex_;
};

/// A property list of entries by path as it stands on disk; empty when it cannot be read.
PropertyList readFontRecord(const RootDirectory& root, const char* logicalPath);

/// The same of a file that was opened, or could not be.
PropertyList fontRecordIn(const OpenedFile& opened);

}  // namespace typhon
