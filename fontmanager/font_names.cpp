#include "fontmanager/font_names.h"

#include "fontmanager/name_records.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <memory>
#include <string_view>
#include <utility>

#include <ft2build.h>
#include <sys/stat.h>
#include <unistd.h>

#include FT_FREETYPE_H
#include FT_MODULE_H

// Font files come from anybody, and FreeType reads many formats. Only the two that applications install are
// let through to it, told by their first four bytes, and it reads the file a piece at a time: a mapped file
// that somebody shortens would kill the process.

namespace typhon {

namespace {

struct LibraryDeleter {
    void operator()(FT_Library library) const { FT_Done_FreeType(library); }
};
struct FaceDeleter {
    void operator()(FT_Face face) const { FT_Done_Face(face); }
};
using Library = std::unique_ptr<FT_LibraryRec_, LibraryDeleter>;
using Face = std::unique_ptr<FT_FaceRec_, FaceDeleter>;

FontNamesReading failure(std::string error)
{
    return {.familyNames = std::nullopt, .error = std::move(error)};
}

std::size_t readAt(int descriptor, std::uint64_t offset, unsigned char* buffer, std::size_t count)
{
    std::size_t filled = 0;
    while (filled < count) {
        const auto part =
            ::pread(descriptor, buffer + filled, count - filled, static_cast<off_t>(offset + filled));
        if (part < 0 && errno == EINTR) {
            continue;
        }
        if (part <= 0) {
            break;
        }
        filled += static_cast<std::size_t>(part);
    }
    return filled;
}

/// The file as FreeType reads it: in many small pieces, most of them near the last one, which come from a
/// block that is kept.
class FontStream {
public:
    FontStream(int descriptor, std::uint64_t size) : descriptor_(descriptor)
    {
        stream_.size = static_cast<unsigned long>(size);
        stream_.descriptor.pointer = this;
        stream_.read = readForFreeType;
    }
    FontStream(const FontStream&) = delete;
    FontStream& operator=(const FontStream&) = delete;

    FT_StreamRec* get() { return &stream_; }

private:
    /// As FreeType wants it: bytes read, or with a count of zero, whether seeking failed.
    static unsigned long readForFreeType(FT_Stream stream, unsigned long offset, unsigned char* buffer,
                                         unsigned long count)
    {
        if (count == 0) {
            return offset > stream->size ? 1 : 0;
        }
        return static_cast<FontStream*>(stream->descriptor.pointer)->read(offset, buffer, count);
    }

    unsigned long read(std::uint64_t offset, unsigned char* buffer, std::size_t count)
    {
        if (count > block_.size()) {
            return readAt(descriptor_, offset, buffer, count);
        }
        if (offset < blockOffset_ || offset - blockOffset_ > filled_ ||
            filled_ - (offset - blockOffset_) < count) {
            blockOffset_ = offset;
            filled_ = readAt(descriptor_, offset, block_.data(), block_.size());
        }
        const std::size_t start = offset - blockOffset_;
        const std::size_t available = std::min(count, filled_ - start);
        std::copy_n(block_.data() + start, available, buffer);
        return available;
    }

    const int descriptor_;
    FT_StreamRec stream_{};
    std::array<unsigned char, 4096> block_{};
    std::uint64_t blockOffset_ = 0;
    std::size_t filled_ = 0;
};

bool isTrueTypeOrOpenType(int descriptor)
{
    std::array<unsigned char, 4> start{};
    if (readAt(descriptor, 0, start.data(), start.size()) != start.size()) {
        return false;
    }
    const std::string_view tag(reinterpret_cast<const char*>(start.data()), start.size());
    return tag == std::string_view("\0\1\0\0", 4) || tag == "true" || tag == "OTTO" || tag == "ttcf";
}

std::pair<Face, FT_Error> openFaceAs(const char* format, const Library& library, FontStream& stream,
                                     long index)
{
    FT_Open_Args arguments{};
    arguments.flags = FT_OPEN_STREAM | FT_OPEN_DRIVER;
    arguments.stream = stream.get();
    arguments.driver = FT_Get_Module(library.get(), format);
    FT_Face face = nullptr;
    const FT_Error error = arguments.driver == nullptr
                               ? FT_Err_Missing_Module
                               : FT_Open_Face(library.get(), &arguments, index, &face);
    return {Face(error == 0 ? face : nullptr), error};
}

/// A face of the font, or the font without any of its faces for index -1. `stream` outlives it. Left to
/// choose the format itself, FreeType would look for pieces of a damaged font in other files too.
std::pair<Face, FT_Error> openFace(const Library& library, FontStream& stream, long index)
{
    auto trueType = openFaceAs("truetype", library, stream, index);
    if (trueType.first) {
        return trueType;
    }
    auto compact = openFaceAs("cff", library, stream, index);
    const bool isOther = compact.second == FT_Err_Unknown_File_Format;
    return isOther ? std::move(trueType) : std::move(compact);
}

std::string whyUnreadable(FT_Error error)
{
    const char* text = FT_Error_String(error);
    return "the font cannot be read: " +
           (text != nullptr ? std::string(text) : "FreeType error " + std::to_string(error));
}

FontNamesReading readFaces(const Library& library, FontStream& stream, const FontLimits& limits)
{
    const auto [font, error] = openFace(library, stream, -1);
    if (!font) {
        return failure(whyUnreadable(error));
    }
    const long count = font->num_faces;
    if (count < 1 || count > limits.faces) {
        return failure("the font has " + std::to_string(count) + " faces; 1 to " +
                       std::to_string(limits.faces) + " are accepted");
    }
    std::map<std::string, std::string> names;
    for (long index = 0; index < count; ++index) {
        const auto [face, faceError] = openFace(library, stream, index);
        if (!face) {
            return failure("face " + std::to_string(index) + ": " + whyUnreadable(faceError));
        }
        auto postScript = postScriptNameOf(face.get(), limits.nameBytes);
        auto family = familyNameOf(face.get(), limits.nameBytes);
        if (!postScript || !family) {
            return failure("face " + std::to_string(index) + " has no usable " +
                           (postScript ? "family" : "PostScript") + " name");
        }
        const auto [taken, isNew] = names.emplace(std::move(*postScript), std::move(*family));
        if (!isNew) {
            return failure("two faces of the font have the PostScript name " + taken->first);
        }
    }
    return {.familyNames = std::move(names), .error = {}};
}

}  // namespace

std::optional<std::string> whyNoFont(const struct stat& status, const FontLimits& limits)
{
    if (!S_ISREG(status.st_mode)) {
        return "not a regular file";
    }
    if (static_cast<std::uint64_t>(status.st_size) > limits.bytes) {
        return "larger than " + std::to_string(limits.bytes) + " bytes";
    }
    return std::nullopt;
}

FontNamesReading readFontNamesOfSize(int descriptor, std::uint64_t size, const FontLimits& limits)
{
    if (!isTrueTypeOrOpenType(descriptor)) {
        return failure("not a TrueType or OpenType font");
    }
    FT_Library opened = nullptr;
    if (const FT_Error error = FT_Init_FreeType(&opened)) {
        return failure(whyUnreadable(error));
    }
    const Library library(opened);
    FontStream stream(descriptor, size);
    return readFaces(library, stream, limits);
}

FontNamesReading readFontNames(int descriptor, const FontLimits& limits)
{
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        return failure("not a regular file");
    }
    if (auto error = whyNoFont(status, limits)) {
        return failure(std::move(*error));
    }
    return readFontNamesOfSize(descriptor, static_cast<std::uint64_t>(status.st_size), limits);
}

}  // namespace typhon
