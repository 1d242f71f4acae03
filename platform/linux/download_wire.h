#pragma once

#include "platform/linux/signing.h"

#include <cstdint>
#include <optional>
#include <string>

namespace typhon {

// What passes between whoever wants something downloaded and the program that does it: one packet each way,
// over a socket of packets that is the program's standard input. The daemon trusts nothing that comes back.

/// What to download, and what it may cost.
struct DownloadRequest {
    std::string url;
    /// A file with the certificate authorities to believe; empty for those of the system.
    std::string certificates;
    std::uint64_t mostBytes = 0;
    /// Bytes a second; 0 for as fast as it goes.
    std::uint64_t bytesPerSecond = 0;
    /// Without a connection, and without a byte.
    std::uint32_t stallSeconds = 0;
    /// Altogether, redirections included.
    std::uint32_t totalSeconds = 0;
    bool operator==(const DownloadRequest&) const = default;
};

/// What was downloaded, or why nothing was. Unverified.
struct DownloadAnswer {
    Bytes contents;
    /// One visible line; empty when there are contents.
    std::string error;
};

/// False when the other end is gone. Does not wait.
bool sendDownloadRequest(int socket, const DownloadRequest& request);
/// Waits for the request; null for anything else.
std::optional<DownloadRequest> receiveDownloadRequest(int socket);

/// Sends what is in a memory file, which it seals; or, without a file, why there is nothing.
void sendDownloadAnswer(int socket, const std::string& error, int memoryFile = -1);
/// Takes the answer that is there, of at most so many bytes. Does not wait. Whatever it is not is an error.
DownloadAnswer receiveDownloadAnswer(int socket, std::size_t mostBytes);

}  // namespace typhon
