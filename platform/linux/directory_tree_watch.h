#pragma once

#include "platform/linux/directory_watch.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <set>
#include <string>

namespace typhon {

/// Puts watches on a directory, on everything below it, and on the way to it, so that it is noticed when the
/// directory comes, goes, or is another one. No symbolic link is followed below it. One thread at a time.
class DirectoryTreeWatch {
public:
    /// `path`: the directory's logical path, without a final "/". Everything given outlives this.
    DirectoryTreeWatch(const RootDirectory& root, std::string path, Log& log)
        : root_(root), path_(std::move(path)), log_(log)
    {}

    /// Watches what is there now and was not watched, and lists it after that; adds to `seen` the paths of
    /// all directories that are watched for this tree, and to `appeared` those of the directories that are
    /// watched for the first time and of the files in them.
    void watchAll(DirectoryWatch& watch, std::set<std::string>& seen, std::set<std::string>& appeared);

    /// True for the directory and what is below it.
    bool covers(const std::string& realPath) const;

private:
    void watchWay(DirectoryWatch& watch, std::set<std::string>& seen);
    void watchBelow(DirectoryWatch& watch, int directory, const std::string& path, unsigned depth,
                    std::set<std::string>& seen, std::set<std::string>& appeared);
    bool put(DirectoryWatch& watch, int directory, const std::string& path, const std::string& onlyName,
             bool& isNew);

    const RootDirectory& root_;
    const std::string path_;
    Log& log_;
    bool hasComplained_ = false;
};

}  // namespace typhon
