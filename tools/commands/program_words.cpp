#include "tools/commands/program_words.h"

#include <algorithm>
#include <cstddef>
#include <map>

namespace typhon {

namespace {

using Words = std::vector<std::string>;

/// How many words follow an option as its values.
const std::map<std::string, std::size_t>& valueCounts()
{
    static const std::map<std::string, std::size_t> counts{
        {"--root", 1}, {"--json", 0}, {"--bind", 2}, {"--help", 0}, {"-h", 0},
    };
    return counts;
}

/// The first word from `at` on that is no known option, nor a value of one.
std::size_t endOfOptions(const Words& words, std::size_t at)
{
    while (at < words.size()) {
        const auto option = valueCounts().find(words[at].substr(0, words[at].find('=')));
        if (option == valueCounts().end()) {
            break;
        }
        const bool hasValue = words[at].find('=') != std::string::npos;
        at += 1 + option->second - (hasValue && option->second > 0 ? 1 : 0);
    }
    return std::min(at, words.size());
}

}  // namespace

SplitCommandLine splitCommandLine(const Words& words)
{
    const auto command = endOfOptions(words, 0);
    if (command == words.size() || words[command] != "run") {
        return {words, {}};
    }
    auto program = endOfOptions(words, command + 1);
    const bool isUnknownOption =
        program < words.size() && words[program].starts_with('-') && words[program] != "--";
    if (isUnknownOption) {
        return {words, {}};
    }
    const auto cut = [&](std::size_t at) { return words.begin() + static_cast<std::ptrdiff_t>(at); };
    const auto own = program;
    program += program < words.size() && words[program] == "--" ? 1 : 0;
    return {Words(words.begin(), cut(own)), Words(cut(program), words.end())};
}

}  // namespace typhon
