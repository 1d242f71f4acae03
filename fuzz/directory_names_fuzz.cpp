// Any bytes as the identifier of an application, and as the name of a directory of fonts: each has at most
// one counterpart, and no name leads out of its directory.

#include "fontmanager/directory_names.h"
#include "require.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace typhon {
namespace {

void check(std::string_view bytes)
{
    if (const auto name = directoryNameFromIdentifier(bytes)) {
        require(!name->empty() && name->size() <= 255, "a directory can have the name");
        require(*name != "." && *name != "..", "it is a directory of its own");
        require(name->find('/') == std::string_view::npos && name->find('\0') == std::string_view::npos,
                "the name is one component of a path");
        require(identifierFromDirectoryName(*name) == bytes, "the identifier comes back");
    }
    if (const auto identifier = identifierFromDirectoryName(bytes)) {
        require(directoryNameFromIdentifier(*identifier) == bytes, "a name has one spelling");
    }
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({reinterpret_cast<const char*>(data), size});
    return 0;
}
