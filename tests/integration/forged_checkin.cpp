#include "sdk/typhon_client.h"

#include <cstdint>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include <fcntl.h>
#include <linux/prctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <unistd.h>

// forged-checkin ROOT PROGRAM: makes its own /proc/PID/exe read as PROGRAM, which a process may do in a user
// namespace of its own once it maps no page of its real program any more, and then checks in. Prints what
// the link reads now and whether it got a share in the fonts.

namespace {

struct Mapping {
    std::uintptr_t start = 0;
    std::size_t size = 0;
    int protection = 0;
};

std::string ownProgram()
{
    std::vector<char> path(4096);
    const auto length = ::readlink("/proc/self/exe", path.data(), path.size());
    return {path.data(), length < 0 ? 0 : static_cast<std::size_t>(length)};
}

std::vector<Mapping> mappingsOf(const std::string& program)
{
    std::vector<Mapping> mappings;
    std::ifstream maps("/proc/self/maps");
    for (std::string line; std::getline(maps, line);) {
        std::uintptr_t start = 0;
        std::uintptr_t end = 0;
        char permissions[5] = {};
        if (line.ends_with(program) &&
            std::sscanf(line.c_str(), "%lx-%lx %4s", &start, &end, permissions) == 3) {
            const int protection = (permissions[0] == 'r' ? PROT_READ : 0) |
                                   (permissions[1] == 'w' ? PROT_WRITE : 0) |
                                   (permissions[2] == 'x' ? PROT_EXEC : 0);
            mappings.push_back({start, end - start, protection});
        }
    }
    return mappings;
}

/// Byte by byte and unobserved: the sanitizers guard gaps between variables that are copied along.
[[gnu::no_sanitize("address", "thread", "undefined")]] void copyBytes(void* to, const void* from,
                                                                      std::size_t size)
{
    auto* target = static_cast<volatile unsigned char*>(to);
    const auto* source = static_cast<const volatile unsigned char*>(from);
    for (std::size_t index = 0; index < size; ++index) {
        target[index] = source[index];
    }
}

/// Puts an anonymous copy in the place of a mapping.
bool replaceByCopy(const Mapping& mapping)
{
    void* const place = reinterpret_cast<void*>(mapping.start);
    void* const copy =
        ::mmap(nullptr, mapping.size, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (copy == MAP_FAILED) {
        return false;
    }
    copyBytes(copy, place, mapping.size);
    return ::mprotect(copy, mapping.size, mapping.protection) == 0 &&
           ::mremap(copy, mapping.size, mapping.size, MREMAP_MAYMOVE | MREMAP_FIXED, place) != MAP_FAILED;
}

/// The numbers of /proc/self/stat, by their place in its manual page.
std::vector<std::uint64_t> ownStatus()
{
    std::ifstream file("/proc/self/stat");
    std::string text;
    std::getline(file, text);
    std::istringstream rest(text.substr(text.rfind(')') + 3));
    std::vector<std::uint64_t> numbers{0, 0, 0, 0};
    for (std::uint64_t number = 0; rest >> number;) {
        numbers.push_back(number);
    }
    return numbers;
}

bool readAs(const std::string& program)
{
    const auto status = ownStatus();
    prctl_mm_map map{};
    map.start_code = status.at(26);
    map.end_code = status.at(27);
    map.start_stack = status.at(28);
    map.start_data = status.at(45);
    map.end_data = status.at(46);
    map.start_brk = status.at(47);
    map.brk = reinterpret_cast<std::uintptr_t>(::sbrk(0));
    map.arg_start = status.at(48);
    map.arg_end = status.at(49);
    map.env_start = status.at(50);
    map.env_end = status.at(51);
    const int executable = ::open(program.c_str(), O_RDONLY | O_CLOEXEC);
    map.exe_fd = static_cast<std::uint32_t>(executable);
    return executable >= 0 && ::prctl(PR_SET_MM, PR_SET_MM_MAP, &map, sizeof map, 0) == 0;
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc != 3) {
        return 2;
    }
    for (const auto& mapping : mappingsOf(ownProgram())) {
        if (!replaceByCopy(mapping)) {
            std::perror("replacing the program's pages");
            return 1;
        }
    }
    if (!readAs(argv[2])) {
        std::perror("setting the executable");
        return 1;
    }
    auto client = typhon::TyphonClient::connect({.root = argv[1]});
    auto view = client->checkin();
    if (!view) {
        std::cerr << view.error().message << "\n";
        return 1;
    }
    std::cout << ownProgram() << "\n" << (*view ? "a share in the fonts" : "no share") << "\n";
    return 0;
}
