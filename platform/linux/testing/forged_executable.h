#pragma once

// A process that makes its own /proc/PID/exe read as another program, as any process may in a user namespace
// of its own. For that it must first unmap every page of its real program, so it goes on in a few
// instructions on a page of their own. For x86-64.

#include <array>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace typhon::testing {

/// One system call, and its result once it was made.
struct PlannedCall {
    std::int64_t number = 0;
    std::array<std::int64_t, 5> arguments{};
    std::int64_t result = 0;
};

#if defined(__x86_64__)

/// Makes the planned calls one after another and then pauses for good. Its code is on the page at `code`.
[[noreturn]] inline void leaveProgram(void* code, PlannedCall* calls)
{
    static constexpr std::array<unsigned char, 57> instructions{
        0x48, 0x89, 0xFB,              // mov rbx, rdi
        0x48, 0x8B, 0x03,              // next: mov rax, [rbx]
        0x48, 0x83, 0xF8, 0xFF,        // cmp rax, -1
        0x74, 0x24,                    // je done
        0x48, 0x8B, 0x7B, 0x08,        // mov rdi, [rbx+8]
        0x48, 0x8B, 0x73, 0x10,        // mov rsi, [rbx+16]
        0x48, 0x8B, 0x53, 0x18,        // mov rdx, [rbx+24]
        0x4C, 0x8B, 0x53, 0x20,        // mov r10, [rbx+32]
        0x4C, 0x8B, 0x43, 0x28,        // mov r8, [rbx+40]
        0x45, 0x31, 0xC9,              // xor r9d, r9d
        0x0F, 0x05,                    // syscall
        0x48, 0x89, 0x43, 0x30,        // mov [rbx+48], rax
        0x48, 0x83, 0xC3, 0x38,        // add rbx, 56
        0x90,                          // nop
        0xEB, 0xD3,                    // jmp next
        0xB8, 0x22, 0x00, 0x00, 0x00,  // done: mov eax, pause
        0x0F, 0x05,                    // syscall
        0xEB, 0xF7,                    // jmp done
    };
    static_assert(sizeof(PlannedCall) == 56);
    std::memcpy(code, instructions.data(), instructions.size());
    ::mprotect(code, 4096, PROT_READ | PROT_EXEC);
    reinterpret_cast<void (*)(PlannedCall*)>(code)(calls);
    ::_exit(1);
}

/// Makes /proc/self/exe read as `program`, writes the result of that (8 bytes) to `stream` and stays.
[[noreturn]] inline void becomeForged(const std::string& program, int stream)
{
    void* const code = ::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    void* const plan = ::mmap(nullptr, 65536, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    const int target = ::open(program.c_str(), O_RDONLY | O_CLOEXEC);
    std::array<char, 4096> own{};
    const auto ownLength = ::readlink("/proc/self/exe", own.data(), own.size() - 1);
    std::vector<PlannedCall> calls;
    FILE* const maps = std::fopen("/proc/self/maps", "re");
    std::array<char, 8192> line;
    while (ownLength > 0 && std::fgets(line.data(), static_cast<int>(line.size()), maps) != nullptr) {
        unsigned long from = 0;
        unsigned long to = 0;
        if (std::strstr(line.data(), own.data()) != nullptr &&
            std::sscanf(line.data(), "%lx-%lx", &from, &to) == 2) {
            calls.push_back(
                {SYS_munmap, {static_cast<std::int64_t>(from), static_cast<std::int64_t>(to - from)}, 0});
        }
    }
    // Besides the executable this sets what the kernel notes of the memory layout; any valid addresses will
    // do.
    auto* const layout = reinterpret_cast<prctl_mm_map*>(static_cast<char*>(plan) + 60000);
    *layout = {0x10000, 0x11000, 0x12000, 0x13000, 0x14000, 0x15000, 0x16000,
               0x17000, 0x18000, 0x17000, 0x18000, nullptr, 0,       static_cast<std::uint32_t>(target)};
    calls.push_back({SYS_prctl,
                     {PR_SET_MM, PR_SET_MM_MAP, reinterpret_cast<std::int64_t>(layout), sizeof *layout, 0},
                     0});
    auto* const first = static_cast<PlannedCall*>(plan);
    const auto result = reinterpret_cast<std::int64_t>(&first[calls.size() - 1].result);
    calls.push_back({SYS_write, {stream, result, 8}, 0});
    calls.push_back({-1, {}, 0});
    std::memcpy(plan, calls.data(), calls.size() * sizeof(PlannedCall));
    leaveProgram(code, first);
}

#endif

}  // namespace typhon::testing
