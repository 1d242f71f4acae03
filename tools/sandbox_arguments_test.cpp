#include "tools/sandbox_arguments.h"

#include <algorithm>
#include <map>

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::Contains;
using testing::HasSubstr;
using testing::Not;
using Words = std::vector<std::string>;

/// A host given by a list of paths: "dir/", "file", "socket=" or "link -> target".
class FakeHost : public HostFiles {
public:
    explicit FakeHost(const Words& paths)
    {
        entries_["/"] = {Kind::directory, ""};
        for (auto path : paths) {
            const auto arrow = path.find(" -> ");
            if (arrow != std::string::npos) {
                entries_[path.substr(0, arrow)] = {Kind::symbolicLink, path.substr(arrow + 4)};
            } else if (path.back() == '/') {
                path.pop_back();
                entries_[path] = {Kind::directory, ""};
            } else if (path.back() == '=') {
                path.pop_back();
                entries_[path] = {Kind::other, ""};
            } else {
                entries_[path] = {Kind::file, ""};
            }
        }
    }
    Kind kind(const std::string& path) const override
    {
        const auto found = entries_.find(path);
        return found == entries_.end() ? Kind::missing : found->second.kind;
    }
    std::string linkTarget(const std::string& path) const override { return entries_.at(path).target; }
    std::optional<Words> names(const std::string& directory) const override
    {
        if (directory == unreadable) {
            return std::nullopt;
        }
        const auto prefix = directory == "/" ? directory : directory + "/";
        Words names;
        for (const auto& [path, entry] : entries_) {
            const auto rest = path.starts_with(prefix) ? path.substr(prefix.size()) : "";
            if (!rest.empty() && rest.find('/') == std::string::npos) {
                names.push_back(rest);
            }
        }
        return names;
    }
    std::string resolved(const std::string& path) const override
    {
        for (const auto& [link, entry] : entries_) {
            if (entry.kind == Kind::symbolicLink && path.starts_with(link + "/")) {
                return "/" + entry.target + path.substr(link.size());
            }
        }
        return path;
    }

    std::string unreadable;

private:
    struct Entry {
        Kind kind;
        std::string target;
    };
    std::map<std::string, Entry> entries_;
};

const Words machine{"/bin -> usr/bin", "/usr/",          "/usr/bin/",
                    "/usr/bin/app",    "/usr/share/",    "/usr/share/doc/",
                    "/home/",          "/home/u/",       "/proc/",
                    "/dev/",           "/tmp/",          "/run/",
                    "/var/",           "/var/mobile/",   "/etc/",
                    "/etc/hosts",      "/swapfile",      "/src",
                    "/tmp/x/",         "/tmp/x/folder/", "/tmp/x/folder/app"};

SandboxRequest request()
{
    return {"/usr/bin/app", "/usr/bin/app", {}, {}};
}

Words wordsFor(const SandboxRequest& request, const Words& host = machine)
{
    auto outcome = sandboxArguments(request, FakeHost(host));
    EXPECT_TRUE(outcome) << outcome.error().message;
    return *outcome;
}

/// Where `sequence` stands in `words`, or -1.
long position(const Words& words, const Words& sequence)
{
    const auto found = std::search(words.begin(), words.end(), sequence.begin(), sequence.end());
    return found == words.end() ? -1 : found - words.begin();
}

void expectBefore(const Words& words, const Words& first, const Words& second)
{
    EXPECT_GE(position(words, first), 0) << first.back();
    EXPECT_GT(position(words, second), position(words, first)) << second.back();
}

TEST(SandboxArguments, SeparateEveryNamespaceAndDropEveryCapability)
{
    const auto words = wordsFor(request());
    for (const char* option :
         {"--unshare-user", "--unshare-ipc", "--unshare-pid", "--unshare-net", "--unshare-uts",
          "--unshare-cgroup-try", "--new-session", "--die-with-parent"}) {
        EXPECT_THAT(words, Contains(option));
    }
    EXPECT_GE(position(words, {"--cap-drop", "ALL"}), 0);
}

TEST(SandboxArguments, BindTheHostReadOnlyAndKeepItsLinks)
{
    const auto words = wordsFor(request());
    EXPECT_GE(position(words, {"--ro-bind", "/usr", "/usr"}), 0);
    EXPECT_GE(position(words, {"--ro-bind", "/swapfile", "/swapfile"}), 0);
    EXPECT_GE(position(words, {"--symlink", "usr/bin", "/bin"}), 0);
    EXPECT_THAT(words, Not(Contains("--bind")));
}

TEST(SandboxArguments, MakeProcDevAndRunAnew)
{
    const auto words = wordsFor(request());
    EXPECT_GE(position(words, {"--proc", "/proc", "--dev", "/dev", "--tmpfs", "/run"}), 0);
    for (const char* own : {"/proc", "/dev", "/tmp", "/run"}) {
        EXPECT_EQ(position(words, {"--ro-bind", own, own}), -1) << own;
    }
}

TEST(SandboxArguments, ShowTheHostsTemporaryFilesInATmpOfItsOwn)
{
    const auto words = wordsFor(request());
    expectBefore(words, {"--tmpfs", "/tmp"}, {"--ro-bind-try", "/tmp/x", "/tmp/x"});
    EXPECT_EQ(position(words, {"--remount-ro", "/tmp"}), -1);
}

TEST(SandboxArguments, LeaveOutTemporaryFoldersThatHoldSockets)
{
    auto host = machine;
    host.push_back("/tmp/agent/");
    host.push_back("/tmp/agent/socket=");
    EXPECT_EQ(position(wordsFor(request(), host), {"--ro-bind-try", "/tmp/agent", "/tmp/agent"}), -1);
}

TEST(SandboxArguments, CoverTheMachinesFontsAndShowItsSockets)
{
    const auto words = wordsFor(request());
    expectBefore(words, {"--ro-bind", "/var", "/var"}, {"--tmpfs", "/var/mobile"});
    expectBefore(words, {"--tmpfs", "/run"}, {"--ro-bind", "/run/typhon", "/run/typhon"});
    EXPECT_EQ(position(words, {"--tmpfs", "/private"}), -1) << "which this host does not have";
    EXPECT_THAT(words, Not(Contains("--setenv")));
}

TEST(SandboxArguments, CoverAScratchSystemButForItsSockets)
{
    auto scratch = request();
    scratch.root = "/home/u";
    auto host = machine;
    host.push_back("/home/u/var/");
    host.push_back("/home/u/var/mobile/");
    const auto words = wordsFor(scratch, host);
    expectBefore(words, {"--ro-bind", "/home", "/home"}, {"--tmpfs", "/home/u/var/mobile"});
    expectBefore(words, {"--tmpfs", "/home/u/var/mobile"},
                 {"--ro-bind", "/home/u/run/typhon", "/home/u/run/typhon"});
    EXPECT_GE(position(words, {"--setenv", "TYPHON_ROOT", "/home/u"}), 0);
    EXPECT_GE(position(words, {"--remount-ro", "/home/u/var/mobile"}), 0);
}

TEST(SandboxArguments, BindToAPlaceThatExists)
{
    auto binding = request();
    binding.binds = {{"/src", "/etc/hosts"}};
    const auto words = wordsFor(binding);
    EXPECT_GE(position(words, {"--bind", "/src", "/etc/hosts"}), 0);
    EXPECT_EQ(position(words, {"--tmpfs", "/etc"}), -1);
}

TEST(SandboxArguments, BindToAPlaceThatTheHostLacks)
{
    auto binding = request();
    binding.binds = {{"/src", "/no/such/place"}};
    const auto words = wordsFor(binding);
    EXPECT_GE(position(words, {"--bind", "/src", "/no/such/place"}), 0);
    EXPECT_EQ(position(words, {"--tmpfs", "/"}), -1);
}

TEST(SandboxArguments, ReplaceAHostFolderInWhichAPlaceIsMade)
{
    auto binding = request();
    binding.binds = {{"/src", "/usr/share/new/place"}};
    const auto words = wordsFor(binding);
    expectBefore(words, {"--ro-bind", "/usr", "/usr"},
                 {"--tmpfs", "/usr/share", "--ro-bind", "/usr/share/doc", "/usr/share/doc"});
    expectBefore(words, {"--tmpfs", "/usr/share"}, {"--bind", "/src", "/usr/share/new/place"});
    expectBefore(words, {"--bind", "/src", "/usr/share/new/place"}, {"--remount-ro", "/usr/share"});
}

TEST(SandboxArguments, CoverFontsAgainInAReplacedFolder)
{
    auto binding = request();
    binding.binds = {{"/src", "/var/new"}};
    expectBefore(wordsFor(binding), {"--ro-bind", "/var/mobile", "/var/mobile"}, {"--tmpfs", "/var/mobile"});
}

TEST(SandboxArguments, BindIntoACoveredFolderWithoutReplacingAnything)
{
    auto binding = request();
    binding.binds = {{"/src", "/var/mobile/Library/UserFonts/FontFiles/a.ttf"}};
    const auto words = wordsFor(binding);
    expectBefore(words, {"--tmpfs", "/var/mobile"}, {"--bind", "/src", binding.binds[0].second});
    EXPECT_EQ(std::count(words.begin(), words.end(), "--tmpfs"), 3);
}

TEST(SandboxArguments, CoverFontsThatABindBringsBack)
{
    auto binding = request();
    binding.root = "/home/u/scratch";
    binding.binds = {{"/home/u", "/home/u"}};
    auto host = machine;
    host.push_back("/home/u/scratch/var/mobile/");
    expectBefore(wordsFor(binding, host), {"--bind", "/home/u", "/home/u"},
                 {"--tmpfs", "/home/u/scratch/var/mobile"});
}

TEST(SandboxArguments, FollowTheHostsLinksToADestination)
{
    auto binding = request();
    binding.binds = {{"/src", "/bin/app"}};
    EXPECT_GE(position(wordsFor(binding), {"--bind", "/src", "/usr/bin/app"}), 0);
}

TEST(SandboxArguments, ShowAProgramInAFolderThatWouldBeMissing)
{
    const auto words = wordsFor({"/run/x/app", "/run/x/app", {}, {}});
    expectBefore(words, {"--tmpfs", "/run"}, {"--ro-bind", "/run/x", "/run/x"});
    EXPECT_GE(position(words, {"--ro-bind", "/run/x/app", "/run/x/app"}), 0);
}

TEST(SandboxArguments, ShowNoMoreThanTheProgramWhereItsFolderIsPrivateOrCovered)
{
    const auto words = wordsFor({"/run/app", "/run/app", {}, {}});
    EXPECT_EQ(position(words, {"--ro-bind", "/run", "/run"}), -1);
    EXPECT_GE(position(words, {"--ro-bind", "/run/app", "/run/app"}), 0);

    const auto covered = wordsFor({"/var/mobile/app", "/var/mobile/app", {}, {}});
    EXPECT_EQ(position(covered, {"--ro-bind", "/var/mobile", "/var/mobile"}), -1);
    EXPECT_GE(position(covered, {"--ro-bind", "/var/mobile/app", "/var/mobile/app"}), 0);
}

TEST(SandboxArguments, StartAProgramUnderTheNameOfALinkThatWouldBeMissing)
{
    const auto words = wordsFor({"/usr/bin/app", "/run/link", {}, {}});
    EXPECT_GE(position(words, {"--ro-bind", "/usr/bin/app", "/run/link"}), 0);
    const auto seen = wordsFor({"/usr/bin/app", "/bin/app", {}, {}});
    EXPECT_EQ(position(seen, {"--ro-bind", "/usr/bin/app", "/bin/app"}), -1);
}

TEST(SandboxArguments, CloseTheRootForWritingAtLast)
{
    const auto words = wordsFor(request());
    EXPECT_EQ(position(words, {"--remount-ro", "/"}), static_cast<long>(words.size()) - 2);
}

TEST(SandboxArguments, RefuseABindOfNothing)
{
    auto binding = request();
    binding.binds = {{"/missing", "/etc/hosts"}};
    const auto outcome = sandboxArguments(binding, FakeHost(machine));
    ASSERT_FALSE(outcome);
    EXPECT_THAT(outcome.error().message, HasSubstr("/missing"));
}

TEST(SandboxArguments, RefuseAPlaceInAFolderThatCannotBeReplaced)
{
    auto binding = request();
    binding.binds = {{"/src", "/etc/new"}};
    FakeHost host(machine);
    host.unreadable = "/etc";
    EXPECT_FALSE(sandboxArguments(binding, host));

    auto crowded = machine;
    for (int i = 0; i <= 2000; ++i) {
        crowded.push_back("/etc/" + std::to_string(i));
    }
    EXPECT_FALSE(sandboxArguments(binding, FakeHost(crowded)));
}

}  // namespace
}  // namespace typhon
