#include "simulation/seeds.h"

#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <numeric>
#include <string_view>

namespace typhon::simulation {

namespace {

constexpr std::uint64_t defaultCount = TYPHON_DEFAULT_SEEDS;

std::vector<std::uint64_t>& chosen()
{
    static std::vector<std::uint64_t> seeds;
    return seeds;
}

std::uint64_t number(std::string_view text)
{
    std::uint64_t value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc{} || end != text.data() + text.size()) {
        std::fprintf(stderr, "not a number: %.*s\n", static_cast<int>(text.size()), text.data());
        std::exit(2);
    }
    return value;
}

void chooseFirst(std::uint64_t count)
{
    chosen().resize(count);
    std::iota(chosen().begin(), chosen().end(), 1);
}

bool take(std::string_view option, std::string_view value)
{
    if (option == "--seed") {
        chosen() = {number(value)};
    } else if (option == "--seeds") {
        chooseFirst(number(value));
    } else {
        return false;
    }
    return true;
}

}  // namespace

const std::vector<std::uint64_t>& seeds()
{
    return chosen();
}

void readSeedOptions(int& argumentCount, char** arguments)
{
    const char* fromEnvironment = std::getenv("TYPHON_SEEDS");
    chooseFirst(fromEnvironment == nullptr ? defaultCount : number(fromEnvironment));
    int kept = 1;
    for (int index = 1; index < argumentCount; ++index) {
        if (index + 1 < argumentCount && take(arguments[index], arguments[index + 1])) {
            ++index;
        } else {
            arguments[kept++] = arguments[index];
        }
    }
    argumentCount = kept;
}

}  // namespace typhon::simulation
