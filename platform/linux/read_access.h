#pragma once

#include "platform/linux/file_credentials.h"
#include "platform/linux/inode.h"

#include <condition_variable>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace typhon {

/// The file at an absolute path below `root`, as somebody whose root directory that is sees it, if the
/// calling thread's credentials allow to reach and to read it.
std::optional<Inode> readableFile(int root, const std::string& path);

/// Asks questions of the file system with the credentials of somebody else, on one thread of its own, which
/// is started when it is first needed. Any thread may ask.
class BorrowedCredentials {
public:
    BorrowedCredentials() = default;
    ~BorrowedCredentials();
    BorrowedCredentials(const BorrowedCredentials&) = delete;
    BorrowedCredentials& operator=(const BorrowedCredentials&) = delete;

    /// Runs `question` with those credentials and waits for its end. False when they cannot be assumed;
    /// `question` was not called then. On the calling thread when they are its own.
    bool ask(const FileCredentials& credentials, const std::function<void()>& question);

private:
    struct Job {
        const FileCredentials& credentials;
        const std::function<void()>& question;
        bool isDone = false;
        bool hasRun = false;
    };
    void serve();

    /// All threads but the own one keep those of the process, which do not change.
    const FileCredentials ownCredentials_ = ownFileCredentials();
    std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<Job*> jobs_;
    bool isEnding_ = false;
    std::thread thread_;
};

}  // namespace typhon
