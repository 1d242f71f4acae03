// Every look is a whole one: watch all there is to watch, then list it all, and begin again if that brought
// up directories that were not watched yet. That is idempotent, sees everything, and costs some milliseconds,
// once in a batch of changes. A directory that is not there yet is awaited in the nearest one above it that
// is.

#include "tools/relayd/application_watch.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <utility>

#include <fcntl.h>

namespace typhon {

namespace {

constexpr std::chrono::milliseconds batchTime{200};
/// How often to look where directories cannot be watched.
constexpr std::chrono::seconds blindPause{60};
/// Somebody may make directories all the time; the next batch brings the next look.
constexpr int mostRounds = 8;

using Path = std::filesystem::path;

FileDescriptor openPlain(const std::string& path)
{
    return FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NONBLOCK));
}

}  // namespace

ApplicationWatch::ApplicationWatch(const Services& services, std::shared_ptr<WorkQueue> queue,
                                   RootDirectory root, std::chrono::nanoseconds window, Removed removed)
    : services_(services), queue_(std::move(queue)), root_(std::move(root)), removed_(std::move(removed)),
      tracker_(window)
{}

void ApplicationWatch::start()
{
    queue_->async([weak = weak_from_this()] {
        const auto self = weak.lock();
        if (!self) {
            return;
        }
        const auto look = [weak] {
            if (const auto live = weak.lock()) {
                live->look();
            }
        };
        auto& [pool, queues, log] = self->services_;
        self->watch_ = std::make_shared<DirectoryWatch>(pool, queues, self->queue_, batchTime,
                                                        [look](const DirectoryWatch::Batch&) { look(); });
        self->nextLook_ = queues.createTimer(*self->queue_, look);
        self->look();
        TYLog_Debug(log, "watching for the removal of applications");
    });
}

void ApplicationWatch::look()
{
    for (int round = 0; round < mostRounds && watchEverything(); ++round) {
    }
    auto present = installed();
    logChanges(present);
    auto removed = tracker_.saw(present, std::chrono::steady_clock::now());
    installed_ = std::move(present);
    if (!removed.empty()) {
        for (const auto& identifier : removed) {
            TYLog(services_.log, "application \"" + identifier + "\" was removed");
        }
        removed_(std::move(removed));
    }
    planNextLook();
}

/// True when something is watched that was not before, and has to be listed.
bool ApplicationWatch::watchEverything()
{
    watched_.clear();
    foundNew_ = false;
    isBlind_ = false;
    watchUsers();
    findSources();
    for (auto& [path, source] : sources_) {
        watchWayTo(source.where);
        watchEntries(source);
        if (const auto complaint = source.applications.refresh()) {
            TYLog_Debug(services_.log, "installed applications in " + path + ": " + *complaint);
        }
        watchEntries(source);
    }
    watch_->keepOnly(watched_);
    return foundNew_;
}

void ApplicationWatch::findSources()
{
    std::map<std::string, Source> sources;
    auto directories = dataDirectories(root_);
    for (auto& where : directories.found) {
        const auto path = where.path();
        auto known = sources_.extract(path);
        if (known.empty()) {
            sources.emplace(
                path,
                Source{where, InstalledApplications(where, InstalledApplications::Contents::entries), {}});
        } else {
            sources.insert(std::move(known));
        }
    }
    if (!directories.isComplete) {
        // A user who could not be listed just now is still there.
        sources.merge(sources_);
    }
    sources_ = std::move(sources);
}

/// Users come and go with the user database, or in a scratch system with the folders of their homes.
void ApplicationWatch::watchUsers()
{
    if (!root_.isScratch()) {
        watch("/etc", openPlain("/etc"), "passwd");
        return;
    }
    const auto homes = root_.real("/home");
    watchAbove(homes);
    if (const auto directory = openPlain(homes)) {
        watch(homes, directory);
    }
}

void ApplicationWatch::watchWayTo(const DataDirectory& where)
{
    watchAbove(where.base);
    const DataDirectory base{.base = where.base, .below = {}, .isUsers = where.isUsers};
    Path at = ".";
    for (const auto& next : Path(where.below) / "applications") {
        const auto directory = base.openDirectory(at);
        if (!directory) {
            return;
        }
        watch((Path(where.base) / at).lexically_normal(), directory, next);
        at /= next;
    }
}

/// Watches for `path` in the nearest directory above it that is there.
void ApplicationWatch::watchAbove(const std::string& path)
{
    for (Path child = path; child.has_relative_path(); child = child.parent_path()) {
        const auto parent = child.parent_path();
        if (const auto directory = openPlain(parent)) {
            watch(parent, directory, child.filename());
            return;
        }
    }
}

void ApplicationWatch::watchEntries(const Source& source)
{
    for (const auto& path : source.applications.entryDirectories()) {
        if (const auto directory = source.where.openDirectory(path)) {
            watch(source.where.path() + "/" + path, directory);
        }
    }
}

void ApplicationWatch::watch(const std::string& path, const FileDescriptor& directory,
                             const std::string& onlyName)
{
    watched_.insert(path);
    const auto outcome = watch_->watch(path, directory.get(), onlyName);
    foundNew_ = foundNew_ || outcome == DirectoryWatch::Outcome::added;
    if (outcome == DirectoryWatch::Outcome::failed) {
        isBlind_ = true;
        if (!std::exchange(blindnessIsLogged_, true)) {
            TYLog_Error(services_.log, "cannot watch " + path + " (" + std::strerror(errno) +
                                           "): looking every minute instead");
        }
    }
}

std::set<std::string> ApplicationWatch::installed()
{
    std::set<std::string> all;
    for (auto& [path, source] : sources_) {
        // The home of a user who has logged out may be gone altogether, and comes back at the next login.
        const bool isAway = source.where.isUsers && source.applications.entryDirectories().empty();
        if (!isAway) {
            source.identifiers = source.applications.identifiers();
        }
        all.insert(source.identifiers.begin(), source.identifiers.end());
    }
    return all;
}

void ApplicationWatch::logChanges(const std::set<std::string>& installed)
{
    const auto log = [this](const std::set<std::string>& some, const std::set<std::string>& others,
                            const char* what) {
        for (const auto& identifier : some) {
            if (!others.contains(identifier)) {
                TYLog_Debug(services_.log, "application \"" + identifier + "\" " + what);
            }
        }
    };
    log(installed, installed_, "is installed");
    log(installed_, installed, "is not installed any more");
}

void ApplicationWatch::planNextLook()
{
    using std::chrono::nanoseconds;
    const auto due = tracker_.nextDue();
    if (!due && !isBlind_) {
        nextLook_->cancel();
        return;
    }
    const auto now = std::chrono::steady_clock::now();
    auto delay = due ? std::max(nanoseconds(*due - now), nanoseconds(0)) : nanoseconds(blindPause);
    if (isBlind_) {
        delay = std::min(delay, nanoseconds(blindPause));
    }
    nextLook_->schedule(delay, delay / 50);
}

}  // namespace typhon
