#include "platform/simulated/simulated_file_system.h"

#include "platform/path_below.h"

#include <algorithm>
#include <utility>

namespace typhon {

namespace {

std::string withoutFinalSlash(std::string path)
{
    while (path.size() > 1 && path.back() == '/') {
        path.pop_back();
    }
    return path;
}

std::string parentOf(const std::string& path)
{
    const auto slash = path.rfind('/');
    return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

std::string prefixOfContents(const std::string& directory)
{
    return directory == "/" ? directory : directory + "/";
}

constexpr std::size_t longestFileName = 255;

class SimulatedDeletion final : public ConfinedDeletion {
public:
    SimulatedDeletion(SimulatedFileSystem& files, std::string tree) : files_(files), tree_(std::move(tree)) {}

    std::optional<std::string> removeItem(const std::string& path) override
    {
        const auto names = namesBelow(tree_, path);
        if (!names || names->empty()) {
            return "not a path below " + tree_;
        }
        if (std::ranges::any_of(*names, [](const auto& name) { return name.size() > longestFileName; })) {
            return "File name too long";
        }
        const auto plain = plainPath(*names);
        if (!files_.exists(plain)) {
            return "No such file or directory";
        }
        if (files_.isUndeletable(plain)) {
            return "Operation not permitted";
        }
        files_.remove(plain);
        return std::nullopt;
    }
    void removeEmptyDirectory(const std::string& path) override
    {
        const auto names = namesBelow(tree_, path + "/");
        const auto plain = names ? plainPath(*names) : std::string();
        const auto contents = names ? files_.contentsOfDirectory(plain) : std::nullopt;
        if (contents && contents->empty()) {
            files_.remove(plain);
        }
    }

private:
    std::string plainPath(const std::vector<std::string>& names) const
    {
        std::string path = withoutFinalSlash(tree_);
        for (const auto& name : names) {
            path += "/" + name;
        }
        return path;
    }

    SimulatedFileSystem& files_;
    const std::string tree_;
};

}  // namespace

bool SimulatedFileSystem::exists(const std::string& path)
{
    return nodes_.contains(withoutFinalSlash(path));
}

PropertyListReading SimulatedFileSystem::readPropertyList(const std::string& path)
{
    const auto name = withoutFinalSlash(path);
    ++reads_[name];
    ++readsInAll_;
    const auto found = nodes_.find(name);
    PropertyListReading reading{.value = std::nullopt, .error = "no such file: " + path};
    if (found != nodes_.end()) {
        reading = found->second.reading;
    }
    if (const auto hook = duringRead_) {
        hook(name);
    }
    return reading;
}

std::optional<std::vector<std::string>> SimulatedFileSystem::contentsOfDirectory(const std::string& path)
{
    const auto name = withoutFinalSlash(path);
    const auto directory = nodes_.find(name);
    if (directory == nodes_.end() || !directory->second.isDirectory) {
        return std::nullopt;
    }
    std::vector<std::string> names;
    const auto prefix = prefixOfContents(name);
    for (auto node = nodes_.lower_bound(prefix); node != nodes_.end(); ++node) {
        const auto& nodePath = node->first;
        if (!nodePath.starts_with(prefix)) {
            break;
        }
        if (nodePath.size() > prefix.size() && nodePath.find('/', prefix.size()) == std::string::npos) {
            names.push_back(nodePath.substr(prefix.size()));
        }
    }
    return names;
}

std::unique_ptr<ConfinedDeletion> SimulatedFileSystem::deletionBelow(const std::string& tree)
{
    return std::make_unique<SimulatedDeletion>(*this, tree);
}

void SimulatedFileSystem::addFile(const std::string& path, PropertyList value)
{
    add(path, Node{.isDirectory = false, .reading = {.value = std::move(value), .error = {}}});
}

void SimulatedFileSystem::addMalformedFile(const std::string& path, std::string error)
{
    add(path, Node{.isDirectory = false, .reading = {.value = std::nullopt, .error = std::move(error)}});
}

void SimulatedFileSystem::addDirectory(const std::string& path)
{
    add(path, Node{.isDirectory = true, .reading = {.value = std::nullopt, .error = "is a directory"}});
}

void SimulatedFileSystem::add(const std::string& path, Node node)
{
    const auto name = withoutFinalSlash(path);
    if (name != "/" && !nodes_.contains(parentOf(name))) {
        addDirectory(parentOf(name));
    }
    nodes_.insert_or_assign(name, std::move(node));
}

void SimulatedFileSystem::remove(const std::string& path)
{
    const auto name = withoutFinalSlash(path);
    nodes_.erase(name);
    const auto prefix = prefixOfContents(name);
    std::erase_if(nodes_, [&](const auto& node) { return node.first.starts_with(prefix); });
}

std::size_t SimulatedFileSystem::reads(const std::string& path) const
{
    const auto found = reads_.find(withoutFinalSlash(path));
    return found == reads_.end() ? 0 : found->second;
}

}  // namespace typhon
