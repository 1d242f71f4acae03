#pragma once

#include <cstdint>

namespace typhon {

// What the two kinds of font-reading process may do. Each function gives 0 or an errno, after which the
// process must not go on.

/// The descriptors of the process that makes the readers.
constexpr int zygoteControl = 0;
/// The descriptors of a reader, and all that it has.
constexpr int readerFont = 0;
constexpr int readerAnswer = 1;

/// For the process that makes the readers, before anything else: no descriptor but the control socket and the
/// standard streams, no new privileges, no tracing, no core files, no capabilities; and in namespaces of its
/// own, with an empty file system and no network, where the system permits that. From then on it can make
/// processes, limit and end them, and talk over descriptors that it has, and nothing else.
int confineZygote();

/// For a reader, right after the fork, with the font and the pipe at any descriptors above 1. Leaves it those
/// two, `memory` bytes of address space, `seconds` of time and of processor time, and the calls that reading
/// the one, writing the other, taking memory and ending need. It ends when its maker, `zygote`, does, and by
/// SIGALRM or SIGXCPU when the time is up.
int confineReader(int font, int answer, std::uint64_t memory, std::uint32_t seconds, int zygote);

}  // namespace typhon
