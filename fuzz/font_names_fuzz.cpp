// Any bytes as a font file. Names that are read are usable ones, and survive the way from a font reader to
// the program that asked; so does an error. The same bytes as such a reader's answer give usable names or an
// error.

#include "fontmanager/font_answer.h"
#include "fontmanager/font_names.h"
#include "fontmanager/name_records.h"
#include "platform/linux/file_descriptor.h"
#include "require.h"

#include <cstddef>
#include <cstdint>
#include <span>

#include <sys/mman.h>
#include <unistd.h>

namespace typhon {
namespace {

constexpr FontLimits limits{.bytes = 1u << 20, .faces = 16, .nameBytes = 64};

void checkReading(const FontNamesReading& reading)
{
    require(reading.familyNames.has_value() == reading.error.empty(), "names or an error");
    if (!reading.familyNames) {
        return;
    }
    require(!reading.familyNames->empty(), "there is a name");
    require(reading.familyNames->size() <= static_cast<std::size_t>(limits.faces), "one name a face");
    for (const auto& [postScript, family] : *reading.familyNames) {
        require(isUsablePostScriptName(postScript, limits.nameBytes), "a usable PostScript name");
        require(isUsableFamilyName(family, limits.nameBytes), "a usable family name");
    }
}

void check(std::span<const std::uint8_t> bytes)
{
    static const FileDescriptor file(::memfd_create("font", MFD_CLOEXEC));
    const bool isWritten =
        ::ftruncate(file.get(), 0) == 0 &&
        ::pwrite(file.get(), bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size());
    require(isWritten, "the font is written");
    const auto reading = readFontNames(file.get(), limits);
    checkReading(reading);
    const auto answer = encodeFontAnswer(reading);
    require(answer.size() <= largestFontAnswer(limits), "an answer has room");
    const auto carried = decodeFontAnswer(answer, limits);
    require(carried.familyNames == reading.familyNames && carried.error == reading.error,
            "the answer carries the reading");
    checkReading(decodeFontAnswer(bytes, limits));
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({data, size});
    return 0;
}
