#include "platform/linux/visible_text.h"
#include "sample.h"

#include <iostream>

namespace typhon::sample {

namespace {

struct Names {
    std::vector<std::string> families;
    std::vector<std::string> postScriptNames;
};

/// Null when the words are not pairs of an option and a name.
std::optional<Names> namesIn(const std::vector<std::string>& words)
{
    Names names;
    for (std::size_t at = 0; at < words.size(); at += 2) {
        const bool isFamily = words[at] == "--family";
        if (at + 1 == words.size() || (!isFamily && words[at] != "--postscript")) {
            return std::nullopt;
        }
        (isFamily ? names.families : names.postScriptNames).push_back(words[at + 1]);
    }
    return names;
}

}  // namespace

int requestFonts(TyphonClient& client, const std::vector<std::string>& words)
{
    const auto names = namesIn(words);
    if (!names) {
        std::cerr << "request takes --family NAME and --postscript NAME, as often as wanted\n";
        return 2;
    }
    const auto answer = client.requestFonts(names->families, names->postScriptNames);
    if (!answer) {
        return complain(answer.error());
    }
    const auto fonts =
        answer->asDictionary() == nullptr ? PropertyList::Dictionary{} : *answer->asDictionary();
    std::size_t read = 0;
    for (const auto& [path, entry] : fonts) {
        printFont(path, entry);
        read += readFont(client, path) ? 1 : 0;
    }
    std::cout << identifier << " was given " << fonts.size() << " font files and read " << read
              << " of them, each from the descriptor it was given\n";
    return read == fonts.size() ? 0 : 1;
}

}  // namespace typhon::sample
