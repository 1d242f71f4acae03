#include "platform/linux/downloads.h"

#include "platform/linux/downloader_process.h"

#include <chrono>
#include <deque>
#include <map>
#include <mutex>
#include <utility>

#include <sys/epoll.h>

namespace typhon {

namespace {

/// For the program to start and to answer after its own time is up.
constexpr auto grace = std::chrono::seconds(5);

/// One download, from its start to its one answer.
class Download : public std::enable_shared_from_this<Download> {
public:
    using Then = std::function<void(DownloadAnswer)>;

    Download(std::shared_ptr<TimerService> timers, DownloadRequest request, Then then)
        : timers_(std::move(timers)), request_(std::move(request)), then_(std::move(then))
    {}

    void begin(EventPool& pool, const RootDirectory& root, const std::string& program)
    {
        std::unique_lock lock(mutex_);
        process_ = std::make_unique<DownloaderProcess>(root, program);
        if (!process_->problem().empty() || !sendDownloadRequest(process_->socket(), request_)) {
            const auto problem = process_->problem();
            lock.unlock();
            finish({{}, problem.empty() ? "the downloader ends at its start" : problem});
            return;
        }
        const auto seconds = std::chrono::seconds(request_.totalSeconds) + grace;
        deadline_ =
            timers_->schedule(seconds, std::chrono::milliseconds(100), [weak = weak_from_this(), seconds] {
                if (const auto self = weak.lock()) {
                    self->finish(
                        {{},
                         "the downloader does not answer within " + std::to_string(seconds.count()) + " s"});
                }
            });
        watch_ = pool.watch(process_->socket(), [weak = weak_from_this()](std::uint32_t) {
            if (const auto self = weak.lock()) {
                self->takeAnswer();
            }
        });
        watch_->arm(EPOLLIN);
    }

    /// Ends it without an answer.
    void drop()
    {
        const std::lock_guard lock(mutex_);
        then_ = nullptr;
        end();
    }

private:
    void takeAnswer()
    {
        std::unique_lock lock(mutex_);
        if (!process_) {
            return;
        }
        auto answer = receiveDownloadAnswer(process_->socket(), request_.mostBytes);
        lock.unlock();
        finish(std::move(answer));
    }

    void finish(DownloadAnswer answer)
    {
        std::unique_lock lock(mutex_);
        const auto then = std::exchange(then_, nullptr);
        end();
        lock.unlock();
        if (then) {
            then(std::move(answer));
        }
    }

    void end()
    {
        timers_->cancel(deadline_);
        watch_.reset();
        process_.reset();
    }

    const std::shared_ptr<TimerService> timers_;
    const DownloadRequest request_;
    std::mutex mutex_;
    // Protected by mutex_.
    Then then_;
    std::unique_ptr<DownloaderProcess> process_;
    std::unique_ptr<EventPool::Watch> watch_;
    TimerService::Key deadline_{};
};

}  // namespace

class Downloads::State : public std::enable_shared_from_this<State> {
public:
    State(EventPool& pool, RootDirectory root, std::string program)
        : pool_(pool), timers_(std::make_shared<TimerService>(pool)), root_(std::move(root)),
          program_(std::move(program))
    {}

    void add(const DownloadRequest& request, bool discretionary, Then then)
    {
        {
            const std::lock_guard lock(mutex_);
            auto& line = discretionary ? patient_ : urgent_;
            if (!isClosed_ && line.size() < mostWaiting) {
                line.push_back({request, std::move(then)});
                then = nullptr;
            }
        }
        if (then) {
            then({{}, "too many downloads are waiting"});
        }
        beginWhatMay();
    }

    void close()
    {
        std::map<std::uint64_t, std::shared_ptr<Download>> running;
        {
            const std::lock_guard lock(mutex_);
            isClosed_ = true;
            urgent_.clear();
            patient_.clear();
            running.swap(running_);
        }
        timers_->close();
        for (const auto& [number, download] : running) {
            download->drop();
        }
    }

private:
    struct Waiting {
        DownloadRequest request;
        Then then;
    };

    void beginWhatMay()
    {
        while (const auto download = next()) {
            download->begin(pool_, root_, program_);
        }
    }

    std::shared_ptr<Download> next()
    {
        const std::lock_guard lock(mutex_);
        const bool mayPatient = urgent_.empty() && running_.empty();
        auto& line = mayPatient ? patient_ : urgent_;
        if (isClosed_ || line.empty() || running_.size() >= mostRunning) {
            return nullptr;
        }
        auto waiting = std::move(line.front());
        line.pop_front();
        const auto number = ++lastNumber_;
        auto download = std::make_shared<Download>(
            timers_, std::move(waiting.request),
            [weak = weak_from_this(), number, then = std::move(waiting.then)](DownloadAnswer answer) {
                then(std::move(answer));
                if (const auto self = weak.lock()) {
                    self->remove(number);
                }
            });
        running_.emplace(number, download);
        return download;
    }

    void remove(std::uint64_t number)
    {
        {
            const std::lock_guard lock(mutex_);
            running_.erase(number);
        }
        // From the pool, so that a row of downloads that fail at once is no recursion.
        pool_.post([weak = weak_from_this()] {
            if (const auto self = weak.lock()) {
                self->beginWhatMay();
            }
        });
    }

    EventPool& pool_;
    const std::shared_ptr<TimerService> timers_;
    const RootDirectory root_;
    const std::string program_;
    std::mutex mutex_;
    // Protected by mutex_.
    bool isClosed_ = false;
    std::uint64_t lastNumber_ = 0;
    std::deque<Waiting> urgent_;
    std::deque<Waiting> patient_;
    std::map<std::uint64_t, std::shared_ptr<Download>> running_;
};

Downloads::Downloads(EventPool& pool, RootDirectory root, std::string program)
    : state_(std::make_shared<State>(pool, std::move(root), std::move(program)))
{}

Downloads::~Downloads()
{
    state_->close();
}

void Downloads::start(const DownloadRequest& request, bool discretionary, Then then)
{
    state_->add(request, discretionary, std::move(then));
}

}  // namespace typhon
