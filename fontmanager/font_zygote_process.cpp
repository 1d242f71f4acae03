#include "fontmanager/font_zygote_process.h"

#include "fontmanager/font_answer.h"
#include "fontmanager/font_request.h"
#include "fontmanager/parser_confinement.h"
#include "platform/linux/descriptor_passing.h"
#include "platform/linux/file_descriptor.h"

#include <array>
#include <csignal>
#include <new>
#include <optional>
#include <span>
#include <utility>

#include <malloc.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

// Making a process by fork from one that is small, has one thread and is confined already costs a fraction of
// starting a program, and hands the reader nothing of the caller's memory. Each reader is made ahead and
// itself waits for a request, the caller gets its answer directly: this process never looks at a font or an
// answer. It only says how the reader ended.

namespace typhon {

namespace {

// How a reader exits.
constexpr int doneStatus = 0;
constexpr int failedStatus = 1;
constexpr int outOfMemoryStatus = 3;
constexpr int unconfinedStatus = 4;
constexpr int noRequestStatus = 5;

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
    auto descriptors = takeDescriptors(message);
    if (descriptors.size() == 2) {
        received.font = std::move(descriptors[0]);
        received.answer = std::move(descriptors[1]);
    }
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

/// What a reader does, to its exit status.
int runReader(int zygote, const FontReadingFunction& readFont)
{
    const auto received = receive();
    if (!received) {
        return noRequestStatus;
    }
    const auto& request = received->request;
    if (confineReader(received->font.get(), received->answer.get(), request.memory, request.seconds,
                      zygote) != 0) {
        return unconfinedStatus;
    }
    const FontLimits limits{.bytes = request.bytes,
                            .faces = static_cast<long>(request.faces),
                            .nameBytes = static_cast<std::size_t>(request.nameBytes)};
    try {
        const auto answer = encodeFontAnswer(readFont(readerFont, request.fileSize, limits));
        ::_exit(writeAll(answer) ? doneStatus : failedStatus);
    } catch (const std::bad_alloc&) {
        ::_exit(outOfMemoryStatus);
    }
}

FontReadingReport reportOf(int status)
{
    if (WIFSIGNALED(status)) {
        const int signal = WTERMSIG(status);
        const bool isLate = signal == SIGXCPU || signal == SIGALRM;
        return {isLate ? FontReadingEnd::timedOut : FontReadingEnd::crashed, signal};
    }
    switch (WEXITSTATUS(status)) {
    case doneStatus:
        return {FontReadingEnd::done, 0};
    case outOfMemoryStatus:
        return {FontReadingEnd::outOfMemory, 0};
    case unconfinedStatus:
        return {FontReadingEnd::unconfined, 0};
    default:
        return {FontReadingEnd::crashed, 0};
    }
}

/// Makes a reader and waits for its end; how it ended, or null when there is nothing more to do.
std::optional<FontReadingReport> serveOne(const FontReadingFunction& readFont)
{
    const int zygote = ::getpid();
    const int reader = ::fork();
    if (reader == 0) {
        ::_exit(runReader(zygote, readFont));
    }
    int status = 0;
    if (reader < 0 || ::waitpid(reader, &status, 0) != reader ||
        (WIFEXITED(status) && WEXITSTATUS(status) == noRequestStatus)) {
        return std::nullopt;
    }
    return reportOf(status);
}

}  // namespace

int runFontZygote(const FontReadingFunction& readFont)
{
    // When memory runs out, the C library would look for more in a way that the filter forbids.
    ::mallopt(M_ARENA_MAX, 1);
    const int error = confineZygote();
    if (!send(FontZygoteGreeting{error == 0 ? fontRequestVersion : 0, error}) || error != 0) {
        return 1;
    }
    while (const auto report = serveOne(readFont)) {
        if (!send(*report)) {
            break;
        }
    }
    return 0;
}

}  // namespace typhon
