#pragma once

#include <string>
#include <vector>

namespace typhon::sample {

/// What a font file says of one of its faces.
struct FaceNames {
    std::string postScriptName;
    std::string familyName;
};

/// The faces of the font file behind an open descriptor, read with FreeType; empty when it is no font.
std::vector<FaceNames> facesInFile(int descriptor);

}  // namespace typhon::sample
