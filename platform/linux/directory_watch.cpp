// Watches are put on open directories, not on paths, so that whoever opens them decides how far a path may
// lead. A directory that is moved away would go on reporting under the path it had; its watch is ended, and
// the owner told to look again.

#include "platform/linux/directory_watch.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <utility>

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr std::uint32_t interesting = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_CLOSE_WRITE |
                                      IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
/// Paths in one batch; with more, it is cheaper to look at everything.
constexpr std::size_t mostPaths = 4096;

}  // namespace

DirectoryWatch::DirectoryWatch(EventPool& pool, WorkQueues& queues, std::shared_ptr<WorkQueue> queue,
                               std::chrono::nanoseconds batchTime, std::function<void(Batch)> handler)
    : pool_(pool), queues_(queues), queue_(std::move(queue)), batchTime_(batchTime),
      handler_(std::move(handler))
{}

DirectoryWatch::~DirectoryWatch() = default;

bool DirectoryWatch::open()
{
    inotify_ = FileDescriptor(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
    if (!inotify_) {
        return false;
    }
    const auto onQueue = [weak = weak_from_this()](void (DirectoryWatch::*step)()) {
        if (const auto self = weak.lock()) {
            (*self.*step)();
        }
    };
    batchEnd_ = queues_.createTimer(*queue_, [onQueue] { onQueue(&DirectoryWatch::endBatch); });
    readable_ = pool_.watch(inotify_.get(), [queue = queue_, onQueue](std::uint32_t) {
        queue->async([onQueue] { onQueue(&DirectoryWatch::readEvents); });
    });
    readable_->arm(EPOLLIN);
    return true;
}

DirectoryWatch::Outcome DirectoryWatch::watch(const std::string& path, int directory,
                                              const std::string& onlyName)
{
    if (!inotify_ && !open()) {
        return Outcome::failed;
    }
    const auto link = "/proc/self/fd/" + std::to_string(directory);
    const int number = ::inotify_add_watch(inotify_.get(), link.c_str(), interesting);
    if (number < 0) {
        return Outcome::failed;
    }
    const auto known = watchByPath_.find(path);
    if (known != watchByPath_.end() && known->second != number) {
        forgetPath(path);
    }
    const bool isNew = watchByPath_.emplace(path, number).second;
    auto& names = watches_[number][path];
    const bool hadAll = !isNew && names.empty();
    if (onlyName.empty()) {
        names.clear();
    } else if (!hadAll) {
        const bool isNewName = names.insert(onlyName).second;
        return isNewName ? Outcome::added : Outcome::known;
    }
    return hadAll ? Outcome::known : Outcome::added;
}

void DirectoryWatch::keepOnly(const std::set<std::string>& paths)
{
    std::vector<std::string> unwanted;
    for (const auto& [path, number] : watchByPath_) {
        if (!paths.contains(path)) {
            unwanted.push_back(path);
        }
    }
    for (const auto& path : unwanted) {
        forgetPath(path);
    }
}

void DirectoryWatch::forgetPath(const std::string& path)
{
    const auto node = watchByPath_.extract(path);
    const auto found = node.empty() ? watches_.end() : watches_.find(node.mapped());
    if (found == watches_.end()) {
        return;
    }
    found->second.erase(path);
    if (found->second.empty()) {
        ::inotify_rm_watch(inotify_.get(), found->first);
        watches_.erase(found);
    }
}

/// `isGone`: the kernel has ended the watch already.
void DirectoryWatch::forgetWatch(int watch, bool isGone)
{
    const auto node = watches_.extract(watch);
    if (node.empty()) {
        return;
    }
    for (const auto& [path, names] : node.mapped()) {
        watchByPath_.erase(path);
    }
    if (!isGone) {
        ::inotify_rm_watch(inotify_.get(), watch);
    }
    noteRescan();
}

void DirectoryWatch::readEvents()
{
    alignas(inotify_event) std::array<char, 65536> buffer;
    for (;;) {
        const auto length = ::read(inotify_.get(), buffer.data(), buffer.size());
        if (length <= 0) {
            break;
        }
        for (std::size_t offset = 0; offset < static_cast<std::size_t>(length);) {
            const auto& event = *reinterpret_cast<const inotify_event*>(buffer.data() + offset);
            take(event);
            offset += sizeof event + event.len;
        }
    }
    readable_->arm(EPOLLIN);
}

void DirectoryWatch::take(const inotify_event& event)
{
    if ((event.mask & IN_Q_OVERFLOW) != 0) {
        noteRescan();
        return;
    }
    if ((event.mask & (IN_IGNORED | IN_MOVE_SELF)) != 0) {
        forgetWatch(event.wd, (event.mask & IN_IGNORED) != 0);
        return;
    }
    const auto found = watches_.find(event.wd);
    if (found == watches_.end() || event.len == 0) {
        return;
    }
    const std::string name = event.name;
    for (const auto& [path, names] : found->second) {
        if (names.empty() || names.contains(name)) {
            note(path + "/" + name);
        }
    }
}

void DirectoryWatch::note(std::string path)
{
    beginBatch();
    if (changed_.size() < mostPaths) {
        changed_.insert(std::move(path));
    } else {
        mustRescan_ = true;
    }
}

void DirectoryWatch::noteRescan()
{
    beginBatch();
    mustRescan_ = true;
}

void DirectoryWatch::beginBatch()
{
    if (!std::exchange(inBatch_, true)) {
        batchEnd_->schedule(batchTime_, batchTime_ / 20);
    }
}

void DirectoryWatch::endBatch()
{
    inBatch_ = false;
    const auto changed = std::exchange(changed_, {});
    handler_({.paths = {changed.begin(), changed.end()}, .mustRescan = std::exchange(mustRescan_, false)});
}

}  // namespace typhon
