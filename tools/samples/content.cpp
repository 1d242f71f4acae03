#include "faces_in_file.h"
#include "platform/linux/visible_text.h"
#include "sample.h"
#include "sdk/web_content_process.h"

#include <cerrno>
#include <cstring>
#include <iostream>
#include <utility>

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

// An application that shows web content, in small. The content process is a child; what matters is that it
// makes its endpoint itself, after the fork: the grants go to the process that listens.

namespace typhon::sample {

namespace {

using Pair = std::pair<FileDescriptor, FileDescriptor>;

std::optional<Pair> socketPair()
{
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        return std::nullopt;
    }
    return Pair{FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

/// A message of one byte, with room for one descriptor.
struct Parcel {
    Parcel()
    {
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control;
        message.msg_controllen = sizeof control;
    }
    Parcel(const Parcel&) = delete;
    Parcel& operator=(const Parcel&) = delete;

    char byte = 0;
    alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
    iovec part{&byte, 1};
    msghdr message{};
};

}  // namespace

bool sendDescriptor(int socket, int descriptor)
{
    Parcel parcel;
    auto* header = CMSG_FIRSTHDR(&parcel.message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
    return ::sendmsg(socket, &parcel.message, MSG_NOSIGNAL) == 1;
}

namespace {

FileDescriptor receiveDescriptor(const FileDescriptor& socket)
{
    Parcel parcel;
    int descriptor = -1;
    if (::recvmsg(socket.get(), &parcel.message, MSG_CMSG_CLOEXEC) == 1) {
        const auto* header = CMSG_FIRSTHDR(&parcel.message);
        if (header != nullptr && header->cmsg_type == SCM_RIGHTS) {
            std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
        }
    }
    return FileDescriptor(descriptor);
}

/// The content process: what it gets, and what it can read of it.
int runContent(const FileDescriptor& host)
{
    auto content = WebContentProcess::listen();
    if (!content) {
        return complain(content.error());
    }
    if (!sendDescriptor(host.get(), content->endpoint().get())) {
        return 1;
    }
    const auto fonts = content->waitForFonts();
    if (!fonts || !*fonts) {
        return fonts ? 1 : complain(fonts.error());
    }
    if (!(*fonts)->info) {
        std::cout << identifier << "'s content process gets no fonts" << std::endl;
        return 0;
    }
    const auto given = fontsIn(*(*fonts)->info);
    std::size_t read = 0;
    for (const auto& [path, entry] : given) {
        const auto file = content->openFont(path);
        read += file && !facesInFile(file->get()).empty() ? 1 : 0;
    }
    std::cout << identifier << "'s content process reads " << read << " of " << given.size()
              << " font files, for grants of its own" << std::endl;
    return read == given.size() ? 0 : 1;
}

int exitCodeOf(pid_t child)
{
    int status = 0;
    while (::waitpid(child, &status, 0) < 0 && errno == EINTR) {
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : 1;
}

}  // namespace

int showContent(TyphonClient& client)
{
    const auto view = checkIn(client);
    auto ends = view ? socketPair() : std::nullopt;
    if (!ends) {
        return view ? 1 : complain(view.error());
    }
    const auto child = ::fork();
    if (child == 0) {
        ends->first = FileDescriptor();
        ::_exit(runContent(ends->second));
    }
    ends->second = FileDescriptor();
    const auto endpoint = receiveDescriptor(ends->first);
    if (child < 0 || !endpoint) {
        return 1;
    }
    const auto outcome = client.checkinForSilkpageProcess(endpoint, std::chrono::seconds(60));
    const int code = exitCodeOf(child);
    return outcome ? code : complain(outcome.error());
}

}  // namespace typhon::sample
