#include "scratch_daemon.h"

#include "platform/linux/file_descriptor.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/signing.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "sample_registry.h"

#include <algorithm>
#include <filesystem>
#include <stdexcept>

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

std::filesystem::path thisProgram()
{
    return std::filesystem::read_symlink("/proc/self/exe");
}

void sign(const RootDirectory& root, const std::vector<std::string>& capabilities)
{
    const auto key = generateSigningKey();
    writeTrustedKey(root, {key.publicKey, {}});
    const FileDescriptor program(::open(thisProgram().c_str(), O_RDONLY | O_CLOEXEC));
    PropertyList::Array granted(capabilities.begin(), capabilities.end());
    writeSignature(root, key,
                   {benchIdentifier,
                    {{"com.vorlan.developer.user-fonts", std::move(granted)}},
                    sha256OfFile(program.get()).value()});
}

void execute(const std::string& root)
{
    const auto daemon = (thisProgram().parent_path() / "typhond").string();
    const int nothing = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    ::dup2(nothing, STDOUT_FILENO);
    ::dup2(nothing, STDERR_FILENO);
    ::execl(daemon.c_str(), daemon.c_str(), "--root", root.c_str(), "--log-level", "error", nullptr);
}

/// Without desktop entries the daemon takes providers for removed applications, and removes their fonts.
void installApplications(const ScratchDirectory& folder)
{
    const auto install = [&](const std::string& identifier) {
        folder.writeFile("/usr/share/applications/" + identifier + ".desktop",
                         "[Desktop Entry]\nType=Application\nName=" + identifier + "\n");
    };
    install(benchIdentifier);
    for (int provider = 0; provider < sampleProviders; ++provider) {
        install(sampleProvider(provider));
    }
}

bool answers(const std::string& socketPath)
{
    try {
        RawClient(socketPath).call(wire::typhonProtocol, wire::checkin.member);
        return true;
    } catch (const std::runtime_error&) {
        return false;
    }
}

}  // namespace

ScratchDaemon::ScratchDaemon(int fonts, const std::vector<std::string>& capabilities)
{
    const auto registry = writeBinaryPropertyList(sampleRegistry(fonts));
    folder_.writeFile("/var/mobile/Library/UserFonts/UserFonts.plist",
                      {reinterpret_cast<const char*>(registry.data()), registry.size()});
    for (const char* folder : {"/var/mobile/Library/UserFonts/FontFiles", "/var/mobile/Library/Preferences",
                               "/var/mobile/Library/UserFonts/FontAssets", "/run/typhon"}) {
        std::filesystem::create_directories(folder_.real(folder));
    }
    installApplications(folder_);
    sign(root_, capabilities);
}

void ScratchDaemon::start()
{
    process_ = Child([this] { execute(folder_.path()); });
    while (!answers(socketPath())) {
        ::usleep(1'000);
    }
}

std::size_t affordableConnections(std::size_t wanted)
{
    constexpr std::size_t other = 200;
    constexpr std::size_t ofOneConnection = 2;
    rlimit limit{};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    return std::min<std::size_t>(wanted, (limit.rlim_cur - other) / ofOneConnection);
}

std::string ScratchDaemon::socketPath(const std::string& service) const
{
    return folder_.real("/run/typhon/" + service);
}

}  // namespace typhon::bench
