// Fonts that a provider installs, from its call to those who use them.

#include "fontconfig_system.h"
#include "fontmanager/font_registry_client.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"
#include "small_fonts.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <fcntl.h>
#include <ft2build.h>
#include <unistd.h>
#include FT_FREETYPE_H

namespace typhon::bench {

namespace {

constexpr int registeredFonts = 5'000;
constexpr int manyFiles = 1'000;

FontRegistryClient connected(const ScratchDaemon& daemon)
{
    auto client = FontRegistryClient::connect({.root = daemon.folder().path(), .helper = std::nullopt});
    if (!client) {
        throw std::runtime_error(client.error().message);
    }
    return std::move(*client);
}

void install(FontRegistryClient& client, const std::vector<std::string>& files)
{
    const auto paths = client.registerFonts("", files, true);
    if (!paths) {
        throw std::runtime_error(paths.error().message);
    }
}

/// Blocks until that client has been told of fonts that came.
void awaitChange(const RawClient& client)
{
    for (;;) {
        sd_bus_message* message = nullptr;
        const int outcome = sd_bus_process(client.bus(), &message);
        const RawClient::Message received(message);
        if (message != nullptr && sd_bus_message_is_method_call(message, wire::fontAddedInfo.interface,
                                                                wire::fontAddedInfo.member) > 0) {
            return;
        }
        if (outcome < 0 || (outcome == 0 && sd_bus_wait(client.bus(), UINT64_MAX) < 0)) {
            throw std::runtime_error("the waiting client was cut off");
        }
    }
}

/// The real fonts of this machine, those of one face each.
std::vector<std::string> realFonts()
{
    std::vector<std::string> fonts;
    for (const auto& file : std::filesystem::recursive_directory_iterator("/usr/share/fonts/truetype")) {
        if (file.path().extension() == ".ttf") {
            fonts.push_back(file.path());
        }
    }
    std::ranges::sort(fonts);
    if (fonts.empty()) {
        throw std::runtime_error("no fonts; install the Debian package fonts-dejavu-core");
    }
    return fonts;
}

/// A new file each time.
double secondsOfInstallation(const ScratchDaemon& daemon, FontRegistryClient& provider,
                             const RawClient& waiting, int number)
{
    const auto name = "/bench-" + std::to_string(number) + ".ttf";
    daemon.folder().writeFile(name, test_fonts::contentsOf(test_fonts::sans));
    const auto begin = secondsNow();
    install(provider, {daemon.folder().real(name)});
    awaitChange(waiting);
    return secondsNow() - begin;
}

void measureOneFile(Report& report)
{
    ScratchDaemon daemon(registeredFonts, {"font-enumeration", "system-installation"});
    daemon.start();
    auto provider = connected(daemon);
    const RawClient waiting(daemon.socketPath());
    waiting.call(wire::checkin.interface, wire::checkin.member);
    FontconfigSystem today(registeredFonts, [fonts = realFonts()](int index, const std::string& path) {
        std::filesystem::create_symlink(fonts[static_cast<std::size_t>(index) % fonts.size()], path);
    });
    int number = 0;
    const Step ours = [&] { return secondsOfInstallation(daemon, provider, waiting, number++); };
    const Step peer = [&] {
        today.add();
        return today.secondsToNotice();
    };
    report.add({"install of one font file, 5,000 registered, until a waiting client holds the change",
                "`fc-cache` and the next process's `FcInit` on a directory of 5,000 faces",
                compare(ours, peer, {.rounds = 6, .steps = 1, .warmUp = 1}), 0.1});
}

/// What placing a name is today, on fonts that are named like those of the sample registry.
void measureMatching(Report& report)
{
    const FontconfigSystem today(registeredFonts, [](int index, const std::string& path) {
        std::ofstream(path, std::ios::binary) << smallFont(index);
    });
    std::vector<std::string> families;
    families.reserve(200);
    for (int index = 0; index < 200; ++index) {
        families.push_back(sampleFamilyName(index * 25));
    }
    report.addFigure("`FcFontMatch` of a family among 5,000 faces",
                     summaryOf(today.secondsOfMatches(families)));
}

/// Copies of real fonts.
std::vector<std::string> manyFonts(const ScratchDirectory& folder)
{
    std::vector<std::string> contents;
    for (const char* font : {test_fonts::sans, test_fonts::sansBold, test_fonts::serif}) {
        contents.push_back(test_fonts::contentsOf(font));
    }
    std::vector<std::string> files;
    for (std::size_t index = 0; index < manyFiles; ++index) {
        const auto name = "/many/font-" + std::to_string(index) + ".ttf";
        folder.writeFile(name, contents[index % contents.size()]);
        files.push_back(folder.real(name));
    }
    return files;
}

void copyAndOpen(FT_Library library, const std::string& file, const std::string& copy)
{
    const FileDescriptor from(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
    const auto contents = readWhole(from.get(), std::size_t(1) << 30);
    const FileDescriptor to(::open(copy.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0644));
    FT_Face face = nullptr;
    if (::write(to.get(), contents.bytes.data(), contents.bytes.size()) !=
            static_cast<ssize_t>(contents.bytes.size()) ||
        ::fdatasync(to.get()) != 0 || FT_New_Face(library, copy.c_str(), 0, &face) != 0) {
        throw std::runtime_error("cannot copy " + file);
    }
    FT_Done_Face(face);
}

double secondsOfCopying(FT_Library library, const std::vector<std::string>& files, const std::string& target)
{
    std::filesystem::remove_all(target);
    std::filesystem::create_directory(target);
    const auto begin = secondsNow();
    for (const auto& file : files) {
        copyAndOpen(library, file, target + file.substr(file.rfind('/')));
    }
    return secondsNow() - begin;
}

double secondsOfInstallations(FontRegistryClient& provider, const std::vector<std::string>& files)
{
    if (!provider.unregisterAllFonts("")) {
        throw std::runtime_error("the fonts cannot be removed");
    }
    const auto begin = secondsNow();
    install(provider, files);
    return secondsNow() - begin;
}

void measureManyFiles(Report& report)
{
    ScratchDaemon daemon(10, {"system-installation"});
    daemon.start();
    auto provider = connected(daemon);
    const auto files = manyFonts(daemon.folder());
    FT_Library library = nullptr;
    FT_Init_FreeType(&library);
    const Step ours = [&] { return secondsOfInstallations(provider, files); };
    const Step peer = [&] { return secondsOfCopying(library, files, daemon.folder().real("/copies")); };
    report.add({"install of 1,000 files in one call",
                "copying, flushing and opening as many with FreeType, once each",
                compare(ours, peer, {.rounds = 3, .steps = 1, .warmUp = 0}), 2});
    FT_Done_FreeType(library);
}

}  // namespace

void measureInstalling(Report& report)
{
    Report::begin("Installing a font");
    measureOneFile(report);
    Report::begin("Installing many fonts");
    measureManyFiles(report);
    Report::begin("Matching with fontconfig");
    measureMatching(report);
}

}  // namespace typhon::bench
