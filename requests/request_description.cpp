#include "requests/request_description.h"

#include "requests/font_name_resolution.h"

#include <array>
#include <string_view>

namespace typhon {

namespace {

void describeNames(const PropertyList& request, std::size_t longest, std::string& text)
{
    for (const std::string_view key : {kLFFontFamilyNameAttribute, kLFFontNameAttribute}) {
        const auto* value = request.find(key);
        const auto* name = value == nullptr ? nullptr : value->asString();
        if (name != nullptr) {
            text.append(key).append(" = \"").append(*name, 0, longest).append("\"; ");
        }
    }
}

}  // namespace

std::string descriptionOf(const PropertyList::Array& requests, std::size_t longest)
{
    std::string text;
    text.reserve(longest);
    text += '(';
    for (const auto& request : requests) {
        text += text.size() == 1 ? "{ " : ", { ";
        describeNames(request, longest, text);
        text += '}';
        if (text.size() > longest) {
            text.resize(longest);
            return text + "...";
        }
    }
    return text + ")";
}

}  // namespace typhon
