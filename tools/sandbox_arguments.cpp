#include "tools/sandbox_arguments.h"

#include "platform/ipc.h"

#include <algorithm>
#include <array>
#include <optional>
#include <set>
#include <string_view>

// The sandbox starts as an empty folder in memory. Every entry of the host's "/" is bound into it read-only,
// but for the folders that it has of its own (/proc, /dev, /run), and the folders with typhon's files are
// covered by empty ones. Its /tmp is its own to write to, with the host's entries bound into it read-only,
// but for those that hold sockets: terminal multiplexers, agents and displays listen there, and whoever
// reaches them has a program started outside. Since "/" is its own, a bind can have a destination that the
// host lacks. A destination inside a folder of the host is another matter, as nothing can be made there: that
// folder is replaced by one in memory which holds a bind of each of its entries. Typhon's sockets are bound
// back, then the binds asked for, then the program itself (with the folder it lies in, if that would not be
// seen otherwise, as programs have files beside them), and at last everything that was made in memory is
// closed for writing, but for /tmp and /run.
//
// No network and no sockets of the host's services: a program that reaches the user's service manager would
// have itself started outside.

namespace typhon {

namespace {

using Words = std::vector<std::string>;
using Kind = HostFiles::Kind;

/// Far below what bubblewrap takes (9,000 words), at three words an entry.
constexpr std::size_t mostEntriesInReplacedFolder = 2000;
constexpr std::array<std::string_view, 3> ownFolders{"/proc", "/dev", "/run"};
constexpr const char* temporary = "/tmp";
/// Where a whole system keeps fonts, registry and preferences.
constexpr std::array<std::string_view, 2> typhonFolders{"/var/mobile", "/private"};

bool isWithin(std::string_view path, std::string_view folder)
{
    return path == folder || folder == "/" ||
           (path.starts_with(folder) && path.substr(folder.size()).starts_with('/'));
}

std::string parentOf(const std::string& path)
{
    const auto slash = path.rfind('/');
    return slash == 0 ? "/" : path.substr(0, slash);
}

class Layout {
public:
    Layout(const SandboxRequest& request, const HostFiles& host) : request_(request), host_(host) {}

    ClientResult<Words> words()
    {
        add({"--unshare-user", "--unshare-ipc", "--unshare-pid", "--unshare-net", "--unshare-uts",
             "--unshare-cgroup-try", "--cap-drop", "ALL", "--new-session", "--die-with-parent"});
        addHost();
        add({"--proc", "/proc", "--dev", "/dev", "--tmpfs", "/run"});
        addTemporary();
        if (auto failure = addReplacedFolders()) {
            return *failure;
        }
        addProgramFolder();
        addBinds(true);
        hideTyphonFolders();
        const auto sockets = request_.root + "/run/typhon";
        add({"--ro-bind", sockets, sockets});
        addBinds(false);
        addProgram();
        closeForWriting();
        if (!request_.root.empty()) {
            add({"--setenv", "TYPHON_ROOT", request_.root});
        }
        return words_;
    }

private:
    void add(std::initializer_list<std::string> words) { words_.insert(words_.end(), words); }

    /// Binds one entry of a host folder at its own path.
    void addEntry(const std::string& path, const char* option = "--ro-bind")
    {
        switch (host_.kind(path)) {
        case Kind::symbolicLink:
            add({"--symlink", host_.linkTarget(path), path});
            break;
        case Kind::directory:
        case Kind::file:
            add({option, path, path});
            break;
        case Kind::missing:
        case Kind::other:
            break;
        }
    }

    void addHost()
    {
        for (const auto& name : host_.names("/").value_or(Words{})) {
            const auto path = "/" + name;
            if (path != temporary &&
                std::find(ownFolders.begin(), ownFolders.end(), path) == ownFolders.end()) {
                addEntry(path);
            }
        }
    }

    void addTemporary()
    {
        add({"--tmpfs", temporary});
        for (const auto& name : host_.names(temporary).value_or(Words{})) {
            const auto path = std::string(temporary) + "/" + name;
            if (!holdsSockets(path) || isWithin(request_.executable, path)) {
                // Temporary files may be gone by the time that bubblewrap looks.
                addEntry(path, "--ro-bind-try");
            }
        }
    }

    /// True as well when it cannot be told.
    bool holdsSockets(const std::string& path) const
    {
        if (host_.kind(path) != Kind::directory) {
            return false;
        }
        const auto names = host_.names(path);
        return !names || std::any_of(names->begin(), names->end(), [&](const std::string& name) {
            return host_.kind(path + "/" + name) == Kind::other;
        });
    }

    /// Binds of folders that hold typhon's come before those are covered, all others after it.
    void addBinds(bool isBeforeCovering)
    {
        for (const auto& [source, destination] : request_.binds) {
            const auto place = placeOf(destination);
            const auto covered = hidden();
            const bool holdsCovered =
                std::any_of(covered.begin(), covered.end(), [&](const std::string& folder) {
                    return folder != place && isWithin(folder, place);
                });
            if (holdsCovered == isBeforeCovering) {
                add({"--bind", source, place});
            }
        }
    }

    /// The folder of a program that lies in a folder of which the sandbox has its own, unless it lies there
    /// directly or among typhon's files.
    void addProgramFolder()
    {
        const auto folder = parentOf(request_.executable);
        const bool isOwn = std::find(ownFolders.begin(), ownFolders.end(), folder) != ownFolders.end();
        if (isInAnyOf(folder, ownFolderNames()) && !isOwn && !isInAnyOf(folder, hidden())) {
            add({"--ro-bind", folder, folder});
        }
    }

    void addProgram()
    {
        add({"--ro-bind", request_.executable, request_.executable});
        if (request_.command != request_.executable && isInOwnFolder(request_.command)) {
            add({"--ro-bind", request_.executable, request_.command});
        }
    }

    static Words ownFolderNames() { return {ownFolders.begin(), ownFolders.end()}; }

    static bool isInAnyOf(const std::string& path, const Words& folders)
    {
        return std::any_of(folders.begin(), folders.end(),
                           [&](const std::string& folder) { return isWithin(path, folder); });
    }

    /// True where the sandbox has a folder of its own, in which anything can be made.
    bool isInOwnFolder(const std::string& path) const
    {
        return isInAnyOf(path, ownFolderNames()) || isInAnyOf(path, hidden());
    }

    Words hidden() const
    {
        Words folders;
        for (const auto folder : typhonFolders) {
            folders.push_back(request_.root + std::string(folder));
        }
        return folders;
    }

    /// Where a destination lies once the host's symbolic links are followed.
    std::string placeOf(const std::string& destination) const
    {
        return isInOwnFolder(destination) ? destination : host_.resolved(destination);
    }

    /// The folder of the host that has to be replaced so that `place` can be made; empty for none.
    std::string folderToReplace(const std::string& place) const
    {
        if (isInOwnFolder(place) || host_.kind(place) != Kind::missing) {
            return {};
        }
        auto folder = parentOf(place);
        while (host_.kind(folder) == Kind::missing) {
            folder = parentOf(folder);
        }
        return folder == "/" || folder == temporary ? std::string() : folder;
    }

    std::optional<ClientError> addReplacedFolders()
    {
        for (const auto& [source, destination] : request_.binds) {
            const auto folder = folderToReplace(placeOf(destination));
            if (host_.kind(source) == Kind::missing) {
                return ClientError{ipc_errors::invalidArguments, "there is no " + source + " to bind",
                                   "Name a file or folder of the host."};
            }
            if (!folder.empty()) {
                replaced_.insert(folder);
            }
        }
        // In the order of their names a folder comes before those within it.
        for (const auto& folder : replaced_) {
            if (auto failure = addReplacedFolder(folder)) {
                return failure;
            }
        }
        return std::nullopt;
    }

    std::optional<ClientError> addReplacedFolder(const std::string& folder)
    {
        const auto names = host_.names(folder);
        if (!names || names->size() > mostEntriesInReplacedFolder) {
            return ClientError{ipc_errors::invalidArguments,
                               "nothing can be put into " + folder + ", which " +
                                   (names ? "holds too many entries" : "cannot be listed"),
                               "Choose a destination outside of it."};
        }
        add({"--tmpfs", folder});
        for (const auto& name : *names) {
            addEntry(folder + "/" + name);
        }
        return std::nullopt;
    }

    void hideTyphonFolders()
    {
        for (const auto& folder : hidden()) {
            if (host_.kind(folder) != Kind::missing) {
                add({"--tmpfs", folder});
                covered_.push_back(folder);
            }
        }
    }

    void closeForWriting()
    {
        for (const auto& folder : covered_) {
            add({"--remount-ro", folder});
        }
        for (const auto& folder : replaced_) {
            add({"--remount-ro", folder});
        }
        add({"--remount-ro", "/"});
    }

    const SandboxRequest& request_;
    const HostFiles& host_;
    Words words_;
    std::set<std::string> replaced_;
    Words covered_;
};

}  // namespace

ClientResult<std::vector<std::string>> sandboxArguments(const SandboxRequest& request, const HostFiles& host)
{
    return Layout(request, host).words();
}

}  // namespace typhon
