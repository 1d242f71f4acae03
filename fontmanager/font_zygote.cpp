#include "fontmanager/font_zygote.h"

#include "platform/linux/descriptor_passing.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/started_program.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <memory>
#include <span>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {

namespace {

using Clock = std::chrono::steady_clock;

/// The milliseconds until then, for poll.
int remaining(Clock::time_point deadline)
{
    const auto rest = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
    return static_cast<int>(std::max<std::chrono::milliseconds::rep>(rest.count(), 0));
}

/// Waits until one of them has something to say; false at the deadline.
bool waitFor(std::span<pollfd> events, Clock::time_point deadline)
{
    while (true) {
        const int count = ::poll(events.data(), events.size(), remaining(deadline));
        if (count >= 0 || errno != EINTR) {
            return count > 0;
        }
    }
}

bool isReadable(int socket)
{
    pollfd event{socket, POLLIN, 0};
    return ::poll(&event, 1, 0) != 0;
}

template <typename Packet>
std::optional<Packet> receive(int socket)
{
    Packet packet;
    const auto size = ::recv(socket, &packet, sizeof packet, MSG_DONTWAIT | MSG_TRUNC);
    return size == sizeof packet ? std::optional(packet) : std::nullopt;
}

bool sendRequest(int socket, const FontRequest& request, const std::array<int, 2>& descriptors)
{
    const std::span bytes(reinterpret_cast<const std::uint8_t*>(&request), sizeof request);
    return sendWithDescriptors(socket, bytes, descriptors) == sizeof request;
}

/// Takes what is in the pipe, and closes it at its end or when there is too much.
void takeAnswer(FileDescriptor& pipe, FontZygote::Outcome& outcome, std::size_t largestAnswer)
{
    std::array<std::uint8_t, 16 * 1024> block;
    const auto count = ::read(pipe.get(), block.data(), block.size());
    if (count < 0 && errno == EINTR) {
        return;
    }
    if (count > 0) {
        outcome.answer.insert(outcome.answer.end(), block.begin(), block.begin() + count);
        outcome.isTooLong = outcome.answer.size() > largestAnswer;
    }
    if (count <= 0 || outcome.isTooLong) {
        pipe = FileDescriptor();
    }
}

}  // namespace

FontZygote::FontZygote(const std::string& program)
{
    start(program);
    if (problem_.empty()) {
        greet();
    }
}

FontZygote::~FontZygote()
{
    if (process_ > 0) {
        ::kill(process_, SIGKILL);
        while (::waitpid(process_, nullptr, 0) < 0 && errno == EINTR) {
        }
    }
}

void FontZygote::start(const std::string& program)
{
    std::array<int, 2> pair{};
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair.data()) != 0) {
        problem_ = "cannot make a socket for the font reader: " + errorText(errno);
        return;
    }
    control_ = FileDescriptor(pair[0]);
    const FileDescriptor theirs(pair[1]);
    process_ = startProgram(program, theirs.get());
    if (process_ < 0) {
        problem_ = "cannot start the font reader " + visibleText(program) + ": " + errorText(-process_);
    }
}

void FontZygote::greet()
{
    std::array<pollfd, 1> events{pollfd{control_.get(), POLLIN, 0}};
    const auto greeting =
        waitFor(events, Clock::now() + grace) ? receive<FontZygoteGreeting>(control_.get()) : std::nullopt;
    if (!greeting) {
        problem_ = "the font reader does not start";
    } else if (greeting->error != 0) {
        problem_ = "the font reader cannot confine itself: " + errorText(greeting->error);
    } else if (greeting->version != fontRequestVersion) {
        problem_ = "the font reader is of another version; start this program again";
    }
}

std::optional<FontZygote::Outcome> FontZygote::read(int descriptor, const FontRequest& request,
                                                    std::size_t largestAnswer)
{
    if (isReadable(control_.get())) {
        // It has ended, or a reader was killed before it was asked for anything.
        return std::nullopt;
    }
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
        return Outcome{.report = {FontReadingEnd::notStarted, errno}, .answer = {}};
    }
    FileDescriptor answer(ends[0]);
    FileDescriptor theirEnd(ends[1]);
    if (!sendRequest(control_.get(), request, {descriptor, theirEnd.get()})) {
        return std::nullopt;
    }
    theirEnd = FileDescriptor();
    const auto deadline = Clock::now() + std::chrono::seconds(request.seconds) + grace;
    Outcome outcome;
    std::optional<FontReadingReport> report;
    while (answer || !report) {
        // A negative descriptor is passed over.
        std::array<pollfd, 2> events{pollfd{answer.get(), POLLIN, 0},
                                     pollfd{report ? -1 : control_.get(), POLLIN, 0}};
        if (!waitFor(events, deadline)) {
            return std::nullopt;
        }
        if (events[0].revents != 0) {
            takeAnswer(answer, outcome, largestAnswer);
        }
        if (events[1].revents != 0) {
            report = receive<FontReadingReport>(control_.get());
            if (!report) {
                return std::nullopt;
            }
        }
    }
    outcome.report = *report;
    return outcome;
}

}  // namespace typhon
