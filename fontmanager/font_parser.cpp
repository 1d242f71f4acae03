#include "fontmanager/font_parser.h"

#include "fontmanager/font_answer.h"
#include "fontmanager/font_zygote.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"

#include <cstring>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

// Readings take turns with a few font-reading processes, which are started when they are needed and kept. One
// of which a reader came to a bad end is thrown away. A reading is tried once more when its process had
// ended, as after somebody killed it; a file cannot do that to it.

namespace typhon {

namespace {

constexpr const char* programName = "typhon-font-parser";
constexpr const char* libraryPrograms = "/usr/libexec/typhon/";

FontNamesReading failure(std::string error)
{
    return {.familyNames = std::nullopt, .error = std::move(error)};
}

/// The same file, open for nothing but reading; the descriptor itself when it is that already.
struct ReadOnlyFile {
    FileDescriptor reopened;
    int descriptor = -1;
};

ReadOnlyFile readOnly(int descriptor)
{
    const int flags = ::fcntl(descriptor, F_GETFL);
    if (flags >= 0 && (flags & O_ACCMODE) == O_RDONLY && (flags & O_PATH) == 0) {
        return {.reopened = {}, .descriptor = descriptor};
    }
    const auto path = "/proc/self/fd/" + std::to_string(descriptor);
    FileDescriptor reopened(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    const int number = reopened.get();
    return {.reopened = std::move(reopened), .descriptor = number};
}

FontRequest requestFor(const struct stat& status, const FontParserLimits& limits)
{
    return {.seconds = static_cast<std::uint32_t>(limits.time.count()),
            .memory = limits.memory,
            .fileSize = static_cast<std::uint64_t>(status.st_size),
            .bytes = limits.font.bytes,
            .faces = static_cast<std::uint64_t>(limits.font.faces),
            .nameBytes = limits.font.nameBytes};
}

std::string crashText(int signal)
{
    const char* description = signal > 0 ? ::sigdescr_np(signal) : nullptr;
    return std::string("crashes the font reader") +
           (description != nullptr ? std::string(" (") + description + ")" : "");
}

FontNamesReading readingOf(const FontZygote::Outcome& outcome, const FontParserLimits& limits)
{
    switch (outcome.report.end) {
    case FontReadingEnd::done:
        return outcome.isTooLong ? failure("has more names than any font")
                                 : decodeFontAnswer(outcome.answer, limits.font);
    case FontReadingEnd::timedOut:
        return failure("takes more than " + std::to_string(limits.time.count()) + " s to read");
    case FontReadingEnd::outOfMemory:
        return failure("takes more than " + std::to_string(limits.memory >> 20) + " MiB of memory to read");
    case FontReadingEnd::unconfined:
        return failure("the font reader cannot confine itself");
    case FontReadingEnd::notStarted:
        return failure("cannot start a font reader: " + errorText(outcome.report.detail));
    case FontReadingEnd::crashed:
        break;
    }
    return failure(outcome.isTooLong ? "has more names than any font" : crashText(outcome.report.detail));
}

}  // namespace

std::string fontParserProgram()
{
    std::error_code error;
    const auto running = std::filesystem::read_symlink("/proc/self/exe", error);
    const auto beside = (running.parent_path() / programName).string();
    return !error && ::access(beside.c_str(), X_OK) == 0 ? beside
                                                         : std::string(libraryPrograms) + programName;
}

FontParser::FontParser(FontParserLimits limits, std::string program)
    : limits_(limits), program_(program.empty() ? fontParserProgram() : std::move(program))
{}

FontParser::~FontParser() = default;

FontNamesReading FontParser::read(int descriptor)
{
    const auto file = readOnly(descriptor);
    struct stat status {};
    if (file.descriptor < 0 || ::fstat(file.descriptor, &status) != 0) {
        return failure("not a file that can be read");
    }
    if (auto error = whyNoFont(status, limits_.font)) {
        return failure(std::move(*error));
    }
    const auto request = requestFor(status, limits_);
    for (int attempt = 0; attempt < 2; ++attempt) {
        auto zygote = take();
        std::string problem = zygote->problem();
        auto outcome = problem.empty()
                           ? zygote->read(file.descriptor, request, largestFontAnswer(limits_.font))
                           : std::nullopt;
        // Any other report may be about a reader that never got the request, which the next one then takes.
        const bool isSound = outcome && outcome->report.end == FontReadingEnd::done;
        giveBack(isSound ? std::move(zygote) : nullptr);
        if (!problem.empty()) {
            return failure(std::move(problem));
        }
        if (outcome) {
            return readingOf(*outcome, limits_);
        }
    }
    return failure("the font reader ended");
}

std::unique_ptr<FontZygote> FontParser::take()
{
    std::unique_lock lock(mutex_);
    returned_.wait(lock, [&] { return busy_ < limits_.processes; });
    ++busy_;
    if (idle_.empty()) {
        lock.unlock();
        return std::make_unique<FontZygote>(program_);
    }
    auto zygote = std::move(idle_.back());
    idle_.pop_back();
    return zygote;
}

void FontParser::giveBack(std::unique_ptr<FontZygote> zygote)
{
    {
        const std::lock_guard lock(mutex_);
        --busy_;
        if (zygote) {
            idle_.push_back(std::move(zygote));
        }
    }
    returned_.notify_one();
}

}  // namespace typhon
