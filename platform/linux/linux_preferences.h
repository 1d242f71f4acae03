#pragma once

#include "platform/linux/preferences_store.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/preferences.h"

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>

namespace typhon {

/// The preferences in /var/mobile/Library/Preferences/com.vorlan.typhond.plist. Several processes, and
/// several objects in one, may use them at once. Reading blocks on the disk when the file was changed;
/// synchronising blocks on the disk and waits at most five seconds for another process that is just writing.
class LinuxPreferences final : public Preferences {
public:
    /// `log` outlives the preferences. Touches no file yet.
    LinuxPreferences(const RootDirectory& root, Log& log);

    std::optional<PropertyList> value(const std::string& key) override;
    void setValue(const std::string& key, std::optional<PropertyList> value) override;
    void changeDictionary(const std::string& key,
                          const std::function<void(PropertyList::Dictionary& entries)>& change) override;
    bool synchronize() override;

    /// All preferences, with unsynchronised changes.
    PropertyList::Dictionary values();

private:
    using Changes = std::map<std::string, std::optional<PropertyList>>;

    std::optional<PropertyList> take(const std::string& key);
    std::optional<std::string> write();
    std::optional<std::string> prepare(PropertyList::Dictionary& merged);
    std::optional<std::string> makeWritable();
    void refresh();
    void complain(std::string& last, const std::string& message);

    Log& log_;
    const std::string path_;

    /// One writer at a time within the process; taken before `mutex_`, never while it is held.
    std::mutex writing_;

    /// The rest is under `mutex_`, which is not held while the disk is written.
    std::mutex mutex_;
    PreferencesStore store_;
    /// Changed and not yet being written; later than those in `beingWritten_`.
    Changes changed_;
    Changes beingWritten_;
    /// The last complaints, which are not repeated until all is well again.
    std::string complaintOfReading_;
    std::string complaintOfWriting_;
};

}  // namespace typhon
