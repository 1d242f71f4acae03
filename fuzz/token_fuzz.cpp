// Any text as an extension token, and any change of a real one: none may be granted.

#include "platform/linux/extension_tokens.h"
#include "require.h"

#include <cstddef>
#include <cstdint>
#include <string>

namespace typhon {
namespace {

using Verdict = ExtensionTokens::Verdict;

constexpr const char* path = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";
constexpr AuditToken target{1, 42, 1000, 77, 501, 5};

/// The input is a list of changes to a real token: where, and what.
void checkChanges(const ExtensionTokens& tokens, const std::string& text)
{
    const auto token = *tokens.issue(target, path);
    auto changed = token;
    for (std::size_t at = 0; at + 1 < text.size(); at += 2) {
        const auto where = static_cast<unsigned char>(text[at]) * 2u % changed.size();
        changed[where] = text[at + 1];
    }
    const auto verdict = tokens.check(changed, target, path);
    require((verdict == Verdict::granted) == (changed == token), "only the token itself is granted");
    require(verdict != Verdict::expired, "a damaged token is not an old one");
}

void check(const std::string& text)
{
    static const ExtensionTokens tokens;
    require(tokens.check(text, target, path) != Verdict::granted, "nobody else can make a token");
    const auto token = tokens.issue(target, text);
    require(!token || tokens.check(*token, target, text) == Verdict::granted || text.ends_with('/'),
            "a token is good for its path");
    require(tokens.check(*tokens.issue(target, path), target, text) == Verdict::refused || text == path ||
                text.starts_with(std::string(path) + "/"),
            "and for no other, but what would lie beneath it");
    checkChanges(tokens, text);
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({reinterpret_cast<const char*>(data), size});
    return 0;
}
