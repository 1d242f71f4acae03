#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"

#include <string>

#include <sys/types.h>

namespace typhon {

/// The socket, below /run/typhon, behind which the service manager starts a downloader for every connection.
inline constexpr const char* downloaderService = "com.vorlan.typhond.asset-downloader";

/// A process that downloads one thing: the service manager's, as a user of its own with the network, or where
/// there is none a child of this process.
class DownloaderProcess {
public:
    /// `program` is what a child executes; empty for the one that belongs to this program. Does not wait.
    explicit DownloaderProcess(const RootDirectory& root, const std::string& program = {});
    /// Ends it.
    ~DownloaderProcess();
    DownloaderProcess(const DownloaderProcess&) = delete;
    DownloaderProcess& operator=(const DownloaderProcess&) = delete;

    /// The socket of packets to it.
    int socket() const { return socket_.get(); }
    /// Why there is none; empty otherwise.
    const std::string& problem() const { return problem_; }

private:
    bool connectToService(const RootDirectory& root);
    void startChild(std::string program);

    FileDescriptor socket_;
    pid_t child_ = -1;
    std::string problem_;
};

}  // namespace typhon
