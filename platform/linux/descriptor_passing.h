#pragma once

#include "platform/linux/file_descriptor.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include <sys/socket.h>
#include <sys/types.h>

namespace typhon {

/// The kernel passes no more with one message.
inline constexpr std::size_t maximumPassedDescriptors = 253;

/// Sends bytes over a Unix socket, with copies of `descriptors` (at most `maximumPassedDescriptors`) that
/// arrive with the first of them. Returns and fails as `sendmsg`, without a signal. Allocates nothing, so
/// that a child process may use it before it executes a program. Any thread.
ssize_t sendWithDescriptors(int socket, std::span<const std::uint8_t> bytes, std::span<const int> descriptors,
                            int flags = 0);

/// Takes possession of all descriptors that came with a message that `recvmsg` has filled in.
std::vector<FileDescriptor> takeDescriptors(msghdr& message);

}  // namespace typhon
