#include "fontmanager/font_zygote_process.h"

#include "fontmanager/font_answer.h"
#include "fontmanager/font_request.h"
#include "fontmanager/parser_confinement.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/pidfd.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <new>
#include <optional>
#include <span>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

// Making a process by fork from one that is small, has one thread and is confined already costs a fraction of
// starting a program, and hands the reader nothing of the caller's memory. This process itself never looks at
// a font or at an answer: the answer goes straight from the reader to the caller.

namespace typhon {

namespace {

constexpr int outOfMemoryStatus = 3;
constexpr int unconfinedStatus = 4;

struct ReceivedRequest {
    FontRequest request;
    FileDescriptor font;
    FileDescriptor answer;
};

template <typename Packet>
bool send(const Packet& packet)
{
    return ::sendto(zygoteControl, &packet, sizeof packet, MSG_NOSIGNAL, nullptr, 0) == sizeof packet;
}

/// The two descriptors of a request. Whatever else came is closed.
void takeDescriptors(msghdr& message, ReceivedRequest& received)
{
    for (auto* header = CMSG_FIRSTHDR(&message); header != nullptr; header = CMSG_NXTHDR(&message, header)) {
        if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) {
            continue;
        }
        const auto count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        for (std::size_t index = 0; index < count; ++index) {
            int descriptor = -1;
            std::memcpy(&descriptor, CMSG_DATA(header) + index * sizeof(int), sizeof descriptor);
            auto& place = !received.font ? received.font : received.answer;
            place = FileDescriptor(descriptor);
        }
    }
}

std::optional<ReceivedRequest> receive()
{
    ReceivedRequest received;
    iovec data{&received.request, sizeof received.request};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(2 * sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const auto size = ::recvmsg(zygoteControl, &message, MSG_CMSG_CLOEXEC);
    if (size < 0) {
        return std::nullopt;
    }
    takeDescriptors(message, received);
    const bool isWhole = size == sizeof received.request && received.request.version == fontRequestVersion;
    return isWhole && received.answer ? std::optional(std::move(received)) : std::nullopt;
}

bool writeAll(std::span<const std::uint8_t> bytes)
{
    while (!bytes.empty()) {
        const auto count = ::write(readerAnswer, bytes.data(), bytes.size());
        if (count < 0) {
            return false;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(count));
    }
    return true;
}

[[noreturn]] void runReader(const ReceivedRequest& received, int zygote, const FontReadingFunction& readFont)
{
    const auto& request = received.request;
    if (confineReader(received.font.get(), received.answer.get(), request.memory, request.seconds, zygote) !=
        0) {
        ::_exit(unconfinedStatus);
    }
    const FontLimits limits{.bytes = request.bytes,
                            .faces = static_cast<long>(request.faces),
                            .nameBytes = static_cast<std::size_t>(request.nameBytes)};
    try {
        const auto answer = encodeFontAnswer(readFont(readerFont, request.fileSize, limits));
        ::_exit(writeAll(answer) ? 0 : 1);
    } catch (const std::bad_alloc&) {
        ::_exit(outOfMemoryStatus);
    }
}

/// Waits for a reader, by its pidfd, for as long as it may take, and no longer than there is somebody to
/// report to. True when it has ended by itself.
bool waitForEnd(int reader, std::uint32_t seconds)
{
    std::array<pollfd, 2> events{pollfd{reader, POLLIN, 0}, pollfd{zygoteControl, POLLRDHUP, 0}};
    // The kernel counts the rest down in it.
    timespec rest{static_cast<time_t>(seconds), 0};
    while (::syscall(SYS_ppoll, events.data(), events.size(), &rest, nullptr, 0) < 0 && errno == EINTR) {
    }
    return events[0].revents != 0;
}

FontReadingReport reportOf(int status, bool wasEnded)
{
    if (WIFSIGNALED(status)) {
        const int signal = WTERMSIG(status);
        const bool isLate = signal == SIGXCPU || (signal == SIGKILL && wasEnded);
        return {isLate ? FontReadingEnd::timedOut : FontReadingEnd::crashed, signal};
    }
    switch (WEXITSTATUS(status)) {
    case 0:
        return {FontReadingEnd::done, 0};
    case outOfMemoryStatus:
        return {FontReadingEnd::outOfMemory, 0};
    case unconfinedStatus:
        return {FontReadingEnd::unconfined, 0};
    default:
        return {FontReadingEnd::crashed, 0};
    }
}

FontReadingReport serve(ReceivedRequest received, const FontReadingFunction& readFont)
{
    const int zygote = ::getpid();
    const int reader = ::fork();
    if (reader == 0) {
        runReader(received, zygote, readFont);
    }
    if (reader < 0) {
        return {FontReadingEnd::notStarted, errno};
    }
    // Else the pipe would not end with the reader.
    received.answer = FileDescriptor();
    const auto handle = openPidfd(reader);
    const bool hasEnded = waitForEnd(handle.get(), received.request.seconds);
    if (!hasEnded) {
        ::kill(reader, SIGKILL);
    }
    int status = 0;
    if (::waitpid(reader, &status, 0) != reader) {
        return {FontReadingEnd::notStarted, errno};
    }
    return reportOf(status, !hasEnded);
}

}  // namespace

int runFontZygote(const FontReadingFunction& readFont)
{
    const int error = confineZygote();
    if (!send(FontZygoteGreeting{error == 0 ? fontRequestVersion : 0, error}) || error != 0) {
        return 1;
    }
    while (auto received = receive()) {
        if (!send(serve(std::move(*received), readFont))) {
            break;
        }
    }
    return 0;
}

}  // namespace typhon
