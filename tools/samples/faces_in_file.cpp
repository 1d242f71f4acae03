#include "faces_in_file.h"

#include <memory>

#include <ft2build.h>
#include FT_FREETYPE_H
#include <sys/mman.h>
#include <sys/stat.h>

namespace typhon::sample {

namespace {

/// The file's bytes, mapped from the descriptor alone: no path is opened.
class Mapping {
public:
    explicit Mapping(int descriptor)
    {
        struct stat status {};
        if (::fstat(descriptor, &status) == 0 && status.st_size > 0) {
            size_ = static_cast<std::size_t>(status.st_size);
            address_ = ::mmap(nullptr, size_, PROT_READ, MAP_PRIVATE, descriptor, 0);
        }
    }
    Mapping(const Mapping&) = delete;
    Mapping& operator=(const Mapping&) = delete;
    ~Mapping()
    {
        if (isValid()) {
            ::munmap(address_, size_);
        }
    }
    bool isValid() const { return address_ != MAP_FAILED; }
    const FT_Byte* bytes() const { return static_cast<const FT_Byte*>(address_); }
    FT_Long size() const { return static_cast<FT_Long>(size_); }

private:
    void* address_ = MAP_FAILED;
    std::size_t size_ = 0;
};

struct Closing {
    void operator()(FT_Library library) const { FT_Done_FreeType(library); }
    void operator()(FT_Face face) const { FT_Done_Face(face); }
};
using Library = std::unique_ptr<FT_LibraryRec_, Closing>;
using Face = std::unique_ptr<FT_FaceRec_, Closing>;

Library makeLibrary()
{
    FT_Library library = nullptr;
    return Library(FT_Init_FreeType(&library) == 0 ? library : nullptr);
}

Face openFace(const Library& library, const Mapping& file, FT_Long index)
{
    FT_Face face = nullptr;
    return Face(FT_New_Memory_Face(library.get(), file.bytes(), file.size(), index, &face) == 0 ? face
                                                                                                : nullptr);
}

std::string textOrDash(const char* text)
{
    return text == nullptr ? "-" : text;
}

}  // namespace

std::vector<FaceNames> facesInFile(int descriptor)
{
    std::vector<FaceNames> faces;
    const auto library = makeLibrary();
    const Mapping file(descriptor);
    FT_Long count = library && file.isValid() ? 1 : 0;
    for (FT_Long index = 0; index < count; ++index) {
        const auto face = openFace(library, file, index);
        if (!face) {
            break;
        }
        count = face->num_faces;
        faces.push_back({textOrDash(FT_Get_Postscript_Name(face.get())), textOrDash(face->family_name)});
    }
    return faces;
}

}  // namespace typhon::sample
