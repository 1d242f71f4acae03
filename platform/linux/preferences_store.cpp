#include "platform/linux/preferences_store.h"

#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <cerrno>
#include <cstdio>
#include <utility>

#include <sys/stat.h>

namespace typhon {

namespace {

constexpr std::size_t mostBytes = 16u << 20;
constexpr mode_t filePermissions = 0600;
constexpr int mostBrokenFiles = 9;

PreferencesStore::Replacement failed(std::optional<std::string> error)
{
    return {.error = std::move(error), .file = {}, .identity = {}};
}

}  // namespace

PreferencesStore::PreferencesStore(std::string path) : path_(std::move(path)) {}

void PreferencesStore::become(State state, std::string error)
{
    state_ = state;
    error_ = std::move(error);
    values_.clear();
    read_ = FileDescriptor();
    identity_ = FileIdentity();
}

void PreferencesStore::refresh()
{
    struct stat status {};
    if (::stat(path_.c_str(), &status) == 0 && read_ && FileIdentity(status) == identity_) {
        return;
    }
    auto opened = openRegularFile(path_);
    if (opened.error == ENOENT) {
        become(State::absent, {});
    } else if (opened.error == EINVAL || opened.error == EISDIR) {
        become(State::malformed, opened.errorText());
    } else if (opened.error != 0) {
        become(State::unavailable, opened.errorText());
    } else {
        const FileIdentity identity(opened.status);
        const bool isSettled = identity.isSettled();
        parse(opened);
        if (state_ != State::unavailable && isSettled) {
            identity_ = identity;
            read_ = std::move(opened.file);
        }
    }
}

void PreferencesStore::parse(const OpenedFile& opened)
{
    const auto contents = readWhole(opened.file.get(), mostBytes);
    if (contents.error != 0) {
        become(contents.error == EFBIG ? State::malformed : State::unavailable, errorText(contents.error));
        return;
    }
    const auto reading = readPropertyList(contents.bytes);
    const auto* values = reading.value ? reading.value->asDictionary() : nullptr;
    if (values == nullptr) {
        become(State::malformed, reading.value ? "its root is not a dictionary" : reading.error);
        return;
    }
    become(State::readable, {});
    values_ = *values;
}

std::optional<PropertyList> PreferencesStore::take(const std::string& key)
{
    auto found = values_.extract(key);
    return found ? std::optional(std::move(found.mapped())) : std::nullopt;
}

PreferencesStore::SetAside PreferencesStore::setAside()
{
    int number = 1;
    struct stat status {};
    const auto name = [&] { return path_ + ".broken-" + std::to_string(number); };
    while (number < mostBrokenFiles && ::lstat(name().c_str(), &status) == 0) {
        ++number;
    }
    if (std::rename(path_.c_str(), name().c_str()) != 0) {
        return {.path = {}, .error = "cannot rename it to " + name() + ": " + errorText(errno)};
    }
    become(State::absent, {});
    return {.path = name(), .error = flushDirectory(directoryOf(path_))};
}

PreferencesStore::Replacement PreferencesStore::replace(const PropertyList::Dictionary& values) const
{
    const auto bytes = writeBinaryPropertyList(values);
    if (bytes.size() > mostBytes) {
        return failed("the preferences would be larger than " + std::to_string(mostBytes) + " bytes");
    }
    if (auto error = prepareReplacement(path_, bytes, filePermissions)) {
        return failed(std::move(error));
    }
    auto written = openRegularFile(replacementOf(path_));
    const FileIdentity before(written.status);
    const bool isSettled = written.error == 0 && before.hasSettledContents();
    if (auto error = finishReplacement(path_)) {
        return failed(std::move(error));
    }
    // The renaming changed its change time. Whoever writes into it from now on changes its modification time,
    // however early: the contents were settled before it got its name.
    struct stat status {};
    if (!isSettled || ::fstat(written.file.get(), &status) != 0 ||
        !FileIdentity(status).hasContentsOf(before)) {
        return {};
    }
    return {.error = {}, .file = std::move(written.file), .identity = FileIdentity(status)};
}

void PreferencesStore::adopt(Replacement replacement, PropertyList::Dictionary values)
{
    if (replacement.file) {
        become(State::readable, {});
        values_ = std::move(values);
        identity_ = replacement.identity;
        read_ = std::move(replacement.file);
    }
}

}  // namespace typhon
