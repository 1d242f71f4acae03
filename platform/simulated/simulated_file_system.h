#pragma once

#include "platform/file_system.h"

#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// A tree of property-list files and directories in memory. Paths are absolute, without "." or "..";
/// a final "/" is dropped. One thread.
class SimulatedFileSystem final : public FileSystem {
public:
    SimulatedFileSystem() { addDirectory("/"); }

    bool exists(const std::string& path) override;
    PropertyListReading readPropertyList(const std::string& path) override;
    std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) override;
    std::unique_ptr<ConfinedDeletion> deletionBelow(const std::string& tree) override;

    /// Adds or replaces a file, with the directories above it.
    void addFile(const std::string& path, PropertyList value);
    /// A file that exists and whose reading fails with `error`.
    void addMalformedFile(const std::string& path, std::string error = "malformed property list");
    void addDirectory(const std::string& path);
    /// Removes a file, or a directory with its contents.
    void remove(const std::string& path);

    /// Called in the midst of every reading: the reading's result is already decided, the reader does not
    /// have it yet. May change the tree.
    void setDuringRead(std::function<void(const std::string& path)> hook) { duringRead_ = std::move(hook); }
    /// Has deletions of that very path fail.
    void setUndeletable(const std::string& path) { undeletable_.insert(path); }
    bool isUndeletable(const std::string& path) const { return undeletable_.contains(path); }
    /// How often a reading of that path, or of any path, was tried.
    std::size_t reads(const std::string& path) const;
    std::size_t reads() const { return readsInAll_; }

private:
    struct Node {
        bool isDirectory = false;
        PropertyListReading reading;
    };

    void add(const std::string& path, Node node);

    std::map<std::string, Node> nodes_;
    std::map<std::string, std::size_t> reads_;
    std::set<std::string> undeletable_;
    std::size_t readsInAll_ = 0;
    std::function<void(const std::string&)> duringRead_;
};

}  // namespace typhon
