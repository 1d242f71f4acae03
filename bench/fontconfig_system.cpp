// fontconfig keeps its state in the process: so whatever uses it here is a process of its own.

#include "fontconfig_system.h"

#include "child.h"
#include "comparison.h"
#include "platform/linux/file_descriptor.h"

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <utility>

#include <fcntl.h>
#include <fontconfig/fontconfig.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

/// Runs `body` in a process that uses that configuration, and gives what it wrote to its descriptor.
std::vector<double> measuredElsewhere(const std::string& configuration,
                                      const std::function<void(int results)>& body)
{
    int ends[2]{};
    if (::pipe2(ends, 0) != 0) {
        throw std::runtime_error("no pipe");
    }
    const FileDescriptor reading(ends[0]);
    FileDescriptor writing(ends[1]);
    const Child process([&] {
        ::setenv("FONTCONFIG_FILE", configuration.c_str(), 1);
        body(writing.get());
    });
    writing = FileDescriptor();
    std::vector<double> results;
    for (double result = 0; ::read(reading.get(), &result, sizeof result) == sizeof result;) {
        results.push_back(result);
    }
    return results;
}

void tell(int results, double result)
{
    [[maybe_unused]] const auto told = ::write(results, &result, sizeof result);
}

void update(int /*results*/)
{
    const int nothing = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    ::dup2(nothing, STDOUT_FILENO);
    ::execlp("fc-cache", "fc-cache", nullptr);
}

/// The number of fonts.
void initialize(int results)
{
    ::FcInit();
    const auto* fonts = FcConfigGetFonts(FcConfigGetCurrent(), FcSetSystem);
    tell(results, fonts == nullptr ? 0 : fonts->nfont);
}

double secondsOfMatch(const std::string& family)
{
    const auto begin = secondsNow();
    auto* pattern = FcPatternCreate();
    FcPatternAddString(pattern, FC_FAMILY, reinterpret_cast<const FcChar8*>(family.c_str()));
    FcConfigSubstitute(nullptr, pattern, FcMatchPattern);
    FcDefaultSubstitute(pattern);
    FcResult result{};
    auto* match = FcFontMatch(nullptr, pattern, &result);
    const auto seconds = secondsNow() - begin;
    FcPatternDestroy(match);
    FcPatternDestroy(pattern);
    return seconds;
}

}  // namespace

FontconfigSystem::FontconfigSystem(int fonts, MakeFont makeFont) : makeFont_(std::move(makeFont))
{
    std::filesystem::create_directory(folder_.real("/fonts"));
    folder_.writeFile("/fonts.conf", "<?xml version=\"1.0\"?>\n<fontconfig><dir>" + folder_.real("/fonts") +
                                         "</dir><cachedir>" + folder_.real("/cache") +
                                         "</cachedir></fontconfig>\n");
    while (next_ < fonts) {
        add();
    }
    secondsToNotice();
}

void FontconfigSystem::add()
{
    makeFont_(next_, folder_.real("/fonts/font-" + std::to_string(next_) + ".ttf"));
    ++next_;
}

double FontconfigSystem::secondsToNotice() const
{
    const auto configuration = folder_.real("/fonts.conf");
    const auto begin = secondsNow();
    measuredElsewhere(configuration, update);
    const auto counts = measuredElsewhere(configuration, initialize);
    const auto seconds = secondsNow() - begin;
    // A file may hold several faces.
    if (counts.size() != 1 || counts.front() < next_) {
        throw std::runtime_error("fontconfig does not know the fonts; is fc-cache there?");
    }
    return seconds;
}

std::vector<double> FontconfigSystem::secondsOfMatches(const std::vector<std::string>& families) const
{
    return measuredElsewhere(folder_.real("/fonts.conf"), [&](int results) {
        ::FcInit();
        for (const auto& family : families) {
            tell(results, secondsOfMatch(family));
        }
    });
}

}  // namespace typhon::bench
