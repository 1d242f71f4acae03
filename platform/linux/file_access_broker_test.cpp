#include "platform/linux/file_access_broker.h"
#include "testing/child_process.h"
#include "testing/scratch_folder.h"

#include <cerrno>
#include <filesystem>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace typhon {
namespace {

using testing::RecordingLog;
using testing::ScratchFolder;

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles";
const std::string folderOfFonts = fontFiles + "/org.example.foundry";
const std::string font = folderOfFonts + "/a.ttf";
const std::string asset = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/x.asset/AssetData/a.ttf";
const std::string managed = "/var/mobile/Library/Fonts/Managed/m.ttf";
constexpr const char* fileNotFound = "org.freedesktop.DBus.Error.FileNotFound";
constexpr const char* expired = "com.vorlan.typhond.Error.Expired";

class OneIdentity : public CodeSigning {
public:
    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken&) override { return task; }
    std::optional<CodeSigningTask> task = CodeSigningTask{"org.example.viewer", {}};
};

AuditToken ownToken()
{
    const auto self = openPidfd(::getpid());
    return tokenOfProcess(self.get());
}

std::string contentsOf(const FileDescriptor& file)
{
    std::string text(100, '\0');
    const auto length = ::pread(file.get(), text.data(), text.size(), 0);
    text.resize(static_cast<std::size_t>(length > 0 ? length : 0));
    return text;
}

/// Both ways of handing files out: through private mounts, and as copies.
struct FileAccessBrokerTest : ::testing::TestWithParam<bool> {
    ScratchFolder folder;
    RecordingLog log;
    ExtensionTokens tokens;
    OneIdentity identity;
    const std::shared_ptr<FileAccessBroker> broker =
        std::make_shared<FileAccessBroker>(identity, tokens, folder.root, log);
    const AuditToken me = ownToken();

    FileAccessBrokerTest() { broker->files().setUsesMounts(GetParam()); }

    std::string tokenFor(const std::string& path) const { return tokens.issue(me, path).value(); }
    std::string errorOf(const std::string& token, const std::string& path)
    {
        const auto opening = broker->open(me, token, path);
        EXPECT_NE(bool(opening.file), !opening.error.name.empty());
        return opening.error.name;
    }
};

INSTANTIATE_TEST_SUITE_P(Ways, FileAccessBrokerTest, ::testing::Bool(),
                         [](const auto& way) { return way.param ? "mounts" : "copies"; });

TEST_P(FileAccessBrokerTest, ATokenOpensItsFile)
{
    folder.write(font, "contents");
    const auto token = tokenFor(font);
    EXPECT_EQ(contentsOf(broker->open(me, token, font).file), "contents");
    EXPECT_EQ(contentsOf(broker->open(me, token + '\0', font).file), "contents");
    EXPECT_FALSE(log.has("copies"));
}

TEST_P(FileAccessBrokerTest, ATokenForADirectoryOpensTheFilesBeneath)
{
    folder.write(font, "contents");
    EXPECT_EQ(contentsOf(broker->open(me, tokenFor(fontFiles), font).file), "contents");
    EXPECT_EQ(contentsOf(broker->open(me, tokenFor(folderOfFonts), font).file), "contents");
    EXPECT_EQ(errorOf(tokenFor(fontFiles + "/org.example.other"), font), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, TheDescriptorIsForReadingAlone)
{
    const auto real = folder.write(font, "contents", 0666);
    const auto file = broker->open(me, tokenFor(font), font).file;
    ASSERT_TRUE(file);
    EXPECT_EQ(::fcntl(file.get(), F_GETFL) & (O_ACCMODE | O_PATH), O_RDONLY);
    EXPECT_LT(::write(file.get(), "x", 1), 0);
    const auto again = "/proc/self/fd/" + std::to_string(file.get());
    const FileDescriptor writable(::open(again.c_str(), O_RDWR | O_CLOEXEC));
    // A sealed copy may open for writing, but takes none.
    EXPECT_FALSE(writable && ::write(writable.get(), "x", 1) == 1);
    EXPECT_NE(::ftruncate(file.get(), 0), 0);
    EXPECT_EQ(contentsOf(file), "contents");
    EXPECT_EQ(std::filesystem::file_size(real), 8u);
}

TEST_P(FileAccessBrokerTest, OtherTokensAreRefused)
{
    folder.write(font, "contents");
    const auto token = tokenFor(font);
    auto other = me;
    ++other.execGeneration;
    EXPECT_EQ(errorOf(tokens.issue(other, font).value(), font), ipc_errors::accessDenied);
    EXPECT_EQ(broker->open(other, token, font).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(broker->open(AuditToken{}, token, font).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(errorOf("", font), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(std::string(1, '\0'), font), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token + std::string(2, '\0'), font), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf("x", font), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, ATokenOfAnEarlierDaemonIsExpired)
{
    folder.write(font, "contents");
    const ExtensionTokens earlier;
    EXPECT_EQ(errorOf(earlier.issue(me, font).value(), font), expired);
}

TEST_P(FileAccessBrokerTest, AGrantDiesWithTheProgramThatGotIt)
{
    folder.write(font, "contents");
    testing::ChildProcess child({"/bin/sh", "-c", "echo 1; read a; exec /bin/cat"});
    ASSERT_EQ(child.read(), "1\n");
    const auto before = child.token();
    const auto token = tokens.issue(before, font).value();
    EXPECT_TRUE(broker->open(before, token, font).file);
    child.write("\n");
    child.waitForEcho();
    // Neither as who it was, on a connection that survived the exec, nor as who it is.
    EXPECT_EQ(broker->open(before, token, font).error.name, ipc_errors::accessDenied);
    EXPECT_EQ(broker->open(child.token(), token, font).error.name, ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, PathsThatLeadElsewhereAreRefused)
{
    folder.write(font, "contents");
    folder.write("/var/mobile/Library/secret", "secret");
    const auto token = tokenFor(fontFiles);
    for (const auto& path :
         {fontFiles, fontFiles + "/", folderOfFonts, folderOfFonts + "/", fontFiles + "/../../secret",
          folderOfFonts + "/../org.example.foundry/a.ttf", folderOfFonts + "/./a.ttf",
          folderOfFonts + "//a.ttf", font + "/", font.substr(1), std::string("/var/mobile/Library/secret"),
          std::string("/etc/passwd"), std::string(), font + std::string("\0", 1),
          font + std::string(5000, 'x'), fontFiles + "Elsewhere/a.ttf"}) {
        EXPECT_EQ(errorOf(token, path), ipc_errors::accessDenied) << path;
    }
    EXPECT_EQ(errorOf(token, font), "");
}

TEST_P(FileAccessBrokerTest, SymbolicLinksAreNotFollowed)
{
    folder.write(font, "contents");
    const auto secret = folder.write("/secret", "secret");
    const auto real = folder.root.real(folderOfFonts);
    std::filesystem::create_symlink(secret, real + "/outside.ttf");
    std::filesystem::create_symlink("a.ttf", real + "/inside.ttf");
    std::filesystem::create_directory_symlink(folder.path, real + "/outside");
    std::filesystem::create_directory_symlink(real, folder.root.real(fontFiles) + "/inside");
    const auto token = tokenFor(fontFiles);
    EXPECT_EQ(errorOf(token, folderOfFonts + "/outside.ttf"), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token, folderOfFonts + "/inside.ttf"), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token, folderOfFonts + "/outside/secret"), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token, fontFiles + "/inside/a.ttf"), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, OnlyRegularFilesAreHandedOut)
{
    folder.write(font, "contents");
    const auto real = folder.root.real(folderOfFonts);
    ASSERT_EQ(::mkfifo((real + "/pipe.ttf").c_str(), 0644), 0);
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    const auto socketPath = real + "/socket.ttf";
    ASSERT_LT(socketPath.size(), sizeof address.sun_path);
    socketPath.copy(address.sun_path, socketPath.size());
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    const auto token = tokenFor(fontFiles);
    EXPECT_EQ(errorOf(token, folderOfFonts + "/pipe.ttf"), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token, folderOfFonts + "/socket.ttf"), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf(token, folderOfFonts), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, AGrantedFileThatIsMissingIsNotFound)
{
    EXPECT_EQ(errorOf(tokenFor(fontFiles), font), fileNotFound);
    folder.write(font, "contents");
    EXPECT_EQ(errorOf(tokenFor(fontFiles), folderOfFonts + "/b.ttf"), fileNotFound);
    EXPECT_EQ(errorOf(tokenFor(fontFiles), font + "/b.ttf"), fileNotFound);
    EXPECT_EQ(errorOf("x", folderOfFonts + "/b.ttf"), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, TreesMayAppearLaterAndBeReplaced)
{
    const auto token = tokenFor(fontFiles);
    EXPECT_EQ(errorOf(token, font), fileNotFound);
    folder.write(font, "first");
    EXPECT_EQ(contentsOf(broker->open(me, token, font).file), "first");
    std::filesystem::rename(folder.root.real(fontFiles), folder.root.real(fontFiles + ".old"));
    folder.write(font, "second");
    EXPECT_EQ(contentsOf(broker->open(me, token, font).file), "second");
    std::filesystem::remove_all(folder.root.real(fontFiles));
    EXPECT_EQ(errorOf(token, font), fileNotFound);
}

TEST_P(FileAccessBrokerTest, SomeTreesOpenToEveryIdentifiedProcess)
{
    folder.write(asset, "asset");
    folder.write(managed, "managed");
    for (const auto& token : {std::string(), std::string(1, '\0')}) {
        EXPECT_EQ(contentsOf(broker->open(me, token, asset).file), "asset");
        EXPECT_EQ(contentsOf(broker->open(me, token, managed).file), "managed");
    }
    EXPECT_EQ(contentsOf(broker->open(me, tokenFor(asset), asset).file), "asset");
    identity.task = CodeSigningTask{};
    EXPECT_EQ(errorOf("", asset), ipc_errors::accessDenied);
    EXPECT_EQ(errorOf("", managed), ipc_errors::accessDenied);
    identity.task = std::nullopt;
    EXPECT_EQ(errorOf("", asset), ipc_errors::accessDenied);
}

TEST_P(FileAccessBrokerTest, AFileThatIsTooLargeToCopyIsNotCopied)
{
    const auto real = folder.write(font, "");
    std::filesystem::resize_file(real, (64u << 20) + 1);
    EXPECT_EQ(errorOf(tokenFor(font), font), GetParam() ? "" : ipc_errors::accessDenied);
}

}  // namespace
}  // namespace typhon
