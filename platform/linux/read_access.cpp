#include "platform/linux/read_access.h"

#include "platform/linux/file_descriptor.h"

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace typhon {

std::optional<Inode> readableFile(int root, const std::string& path)
{
    open_how how{};
    how.flags = O_PATH | O_CLOEXEC;
    how.resolve = RESOLVE_IN_ROOT | RESOLVE_NO_MAGICLINKS;
    const FileDescriptor file(static_cast<int>(::syscall(SYS_openat2, root, path.c_str(), &how, sizeof how)));
    if (!file || ::syscall(SYS_faccessat2, file.get(), "", R_OK, AT_EMPTY_PATH | AT_EACCESS) != 0) {
        return std::nullopt;
    }
    return inodeAt(file.get(), "");
}

BorrowedCredentials::~BorrowedCredentials()
{
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = true;
    }
    changed_.notify_all();
    if (thread_.joinable()) {
        thread_.join();
    }
}

bool BorrowedCredentials::ask(const FileCredentials& credentials, const std::function<void()>& question)
{
    if (credentials == ownCredentials_) {
        question();
        return true;
    }
    Job job{credentials, question};
    std::unique_lock lock(mutex_);
    if (!thread_.joinable()) {
        thread_ = std::thread([this] { serve(); });
    }
    jobs_.push_back(&job);
    changed_.notify_all();
    changed_.wait(lock, [&] { return job.isDone; });
    return job.hasRun;
}

void BorrowedCredentials::serve()
{
    std::unique_lock lock(mutex_);
    for (;;) {
        changed_.wait(lock, [this] { return isEnding_ || !jobs_.empty(); });
        if (isEnding_) {
            return;
        }
        Job& job = *jobs_.front();
        jobs_.erase(jobs_.begin());
        lock.unlock();
        const bool mayAsk = assumeFileCredentials(job.credentials);
        if (mayAsk) {
            job.question();
        }
        lock.lock();
        job.hasRun = mayAsk;
        job.isDone = true;
        changed_.notify_all();
    }
}

}  // namespace typhon
