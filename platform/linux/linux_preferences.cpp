#include "platform/linux/linux_preferences.h"

#include "platform/linux/durable_file.h"

#include <utility>

#include <sys/types.h>

// Readers take the file as they find it, which its replacement as a whole makes safe. A writer locks out the
// other writers, reads the file once more, applies its own changes key by key and replaces the file; so what
// an administrator changed meanwhile under another key survives, and for one key the last writer wins. What
// it wrote itself is not read again, unless somebody has touched the file since.
//
// A store that cannot be understood reads as empty. It is kept aside before the first write. One that merely
// could not be had (no permission, no descriptors, a failing disk) is not touched: writing fails then.

namespace typhon {

namespace {

constexpr const char* storePath = "/var/mobile/Library/Preferences/com.vorlan.typhond.plist";
constexpr mode_t directoryPermissions = 0755;

void mergeInto(PropertyList::Dictionary& values,
               const std::map<std::string, std::optional<PropertyList>>& changes)
{
    for (const auto& [key, value] : changes) {
        if (value) {
            values.insert_or_assign(key, *value);
        } else {
            values.erase(key);
        }
    }
}

}  // namespace

LinuxPreferences::LinuxPreferences(const RootDirectory& root, Log& log)
    : log_(log), path_(root.real(storePath)), store_(path_)
{}

std::optional<PropertyList> LinuxPreferences::value(const std::string& key)
{
    const std::lock_guard lock(mutex_);
    for (const auto* changes : {&changed_, &beingWritten_}) {
        if (const auto change = changes->find(key); change != changes->end()) {
            return change->second;
        }
    }
    refresh();
    const auto found = store_.values().find(key);
    return found == store_.values().end() ? std::nullopt : std::optional(found->second);
}

PropertyList::Dictionary LinuxPreferences::values()
{
    const std::lock_guard lock(mutex_);
    refresh();
    auto values = store_.values();
    mergeInto(values, beingWritten_);
    mergeInto(values, changed_);
    return values;
}

void LinuxPreferences::setValue(const std::string& key, std::optional<PropertyList> value)
{
    const std::lock_guard lock(mutex_);
    changed_.insert_or_assign(key, std::move(value));
}

void LinuxPreferences::changeDictionary(const std::string& key,
                                        const std::function<void(PropertyList::Dictionary& entries)>& change)
{
    const std::lock_guard lock(mutex_);
    auto entries = take(key).value_or(PropertyList()).takeDictionary();
    change(entries);
    changed_.insert_or_assign(key, std::move(entries));
}

/// The value of a key that gets another one before `mutex_` is let go; not shared with anything that is kept
/// here, unless it is just being written.
std::optional<PropertyList> LinuxPreferences::take(const std::string& key)
{
    if (const auto changed = changed_.find(key); changed != changed_.end()) {
        return std::move(changed->second);
    }
    if (const auto written = beingWritten_.find(key); written != beingWritten_.end()) {
        return written->second;
    }
    refresh();
    return store_.take(key);
}

bool LinuxPreferences::synchronize()
{
    const std::lock_guard oneWriter(writing_);
    const auto error = write();
    const std::lock_guard lock(mutex_);
    if (error) {
        // Back to the changes that wait for the next time, but for those that were overtaken meanwhile.
        changed_.merge(beingWritten_);
        complain(complaintOfWriting_, "the preferences were not written: " + *error +
                                          "; make room, or make it writable: the changes are kept in memory "
                                          "and tried again with the next one");
    } else {
        complaintOfWriting_.clear();
    }
    beingWritten_.clear();
    return !error;
}

std::optional<std::string> LinuxPreferences::write()
{
    if (auto error = makeDirectories(directoryOf(path_), directoryPermissions)) {
        return error;
    }
    const FileLock lock(path_ + ".lock");
    if (lock.error()) {
        return lock.error();
    }
    PropertyList::Dictionary merged;
    if (auto error = prepare(merged)) {
        return error;
    }
    auto replacement = store_.replace(merged);
    auto error = std::move(replacement.error);
    if (!error) {
        const std::lock_guard lockOfStore(mutex_);
        store_.adopt(std::move(replacement), std::move(merged));
    }
    return error;
}

/// Merges the changes, which are being written from now on, into the newest contents of the store.
std::optional<std::string> LinuxPreferences::prepare(PropertyList::Dictionary& merged)
{
    const std::lock_guard lock(mutex_);
    refresh();
    if (auto error = makeWritable()) {
        return error;
    }
    beingWritten_ = std::exchange(changed_, {});
    merged = store_.values();
    mergeInto(merged, beingWritten_);
    return std::nullopt;
}

std::optional<std::string> LinuxPreferences::makeWritable()
{
    if (store_.state() == PreferencesStore::State::unavailable) {
        return "cannot read " + path_ + ": " + store_.error() + " (make it readable for this user)";
    }
    if (store_.state() != PreferencesStore::State::malformed) {
        return std::nullopt;
    }
    auto [kept, error] = store_.setAside();
    if (error) {
        return path_ + " is malformed, and " + *error;
    }
    TYLog_Error(log_, "the malformed preferences " + path_ + " are kept as " + kept +
                          "; repair that file and set its values again, or delete it");
    return std::nullopt;
}

void LinuxPreferences::refresh()
{
    store_.refresh();
    switch (store_.state()) {
    case PreferencesStore::State::absent:
    case PreferencesStore::State::readable:
        complaintOfReading_.clear();
        break;
    case PreferencesStore::State::malformed:
        complain(complaintOfReading_, "the preferences " + path_ +
                                          " are malformed and read as empty: " + store_.error() +
                                          "; repair the file, or the next change starts anew");
        break;
    case PreferencesStore::State::unavailable:
        complain(complaintOfReading_,
                 "cannot read the preferences " + path_ + ", which read as empty: " + store_.error());
        break;
    }
}

void LinuxPreferences::complain(std::string& last, const std::string& message)
{
    if (last != message) {
        last = message;
        TYLog_Error(log_, message);
    }
}

}  // namespace typhon
