#pragma once

#include "platform/linux/data_directories.h"
#include "platform/linux/directory_watch.h"
#include "platform/linux/installed_applications.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/work_queues.h"
#include "tools/relayd/removal_tracker.h"

#include <chrono>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Notices that applications are removed: their desktop entries go from every data directory and do not come
/// back in time. What was removed while nobody watched is not noticed. Hold it by a shared pointer. All work
/// is done on the queue.
class ApplicationWatch : public std::enable_shared_from_this<ApplicationWatch> {
public:
    struct Services {
        EventPool& pool;
        WorkQueues& queues;
        Log& log;
    };
    using Removed = std::function<void(std::vector<std::string> bundleIdentifiers)>;

    /// `window`: how long an entry may be missing. `removed` is called on the queue.
    ApplicationWatch(const Services& services, std::shared_ptr<WorkQueue> queue, RootDirectory root,
                     std::chrono::nanoseconds window, Removed removed);

    /// Begins; what is installed when the first look is done is what can be removed. Once.
    void start();

private:
    struct Source {
        DataDirectory where;
        InstalledApplications applications;
        /// What it held when its directory was last there.
        std::set<std::string> identifiers;
    };

    void look();
    void findSources();
    bool watchEverything();
    void watchUsers();
    void watchWayTo(const DataDirectory& where);
    void watchAbove(const std::string& path);
    void watchEntries(const Source& source);
    void watch(const std::string& path, const FileDescriptor& directory, const std::string& onlyName = {});
    std::set<std::string> installed();
    void logChanges(const std::set<std::string>& installed);
    void planNextLook();

    const Services services_;
    const std::shared_ptr<WorkQueue> queue_;
    const RootDirectory root_;
    const Removed removed_;

    // Owned by the queue.
    std::shared_ptr<DirectoryWatch> watch_;
    std::unique_ptr<Timer> nextLook_;
    RemovalTracker tracker_;
    /// By the data directory's path.
    std::map<std::string, Source> sources_;
    std::set<std::string> installed_;
    std::set<std::string> watched_;
    bool foundNew_ = false;
    bool isBlind_ = false;
    bool blindnessIsLogged_ = false;
};

}  // namespace typhon
