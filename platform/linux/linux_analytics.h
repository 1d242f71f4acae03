#pragma once

#include "platform/analytics.h"
#include "platform/linux/journal_event.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace typhon {

/// Analytics on Linux. On a machine events go to the journal, each as one entry with fields of its own; in a
/// scratch system to the file `eventsPath`, in the journal's export format. Where there is no journal nobody
/// collects, and nothing is built. An event that cannot be written is dropped. Any thread. Events are built
/// and written in a moment, on a queue of their own, so that nobody who waits for an answer waits for that
/// too.
class LinuxAnalytics final : public Analytics {
public:
    /// Of a scratch system. Gone with the boot, like the journal's share of it.
    static constexpr const char* eventsPath = "/run/typhon/analytics.export";
    static constexpr const char* journalSocket = "/run/systemd/journal/socket";
    /// Beyond this the file takes no more.
    static constexpr std::int64_t largestFile = 16 << 20;

    /// `log` and `queues` outlive this. `socket`: the journal's.
    LinuxAnalytics(const RootDirectory& root, Log& log, WorkQueues& queues,
                   std::string socket = journalSocket);

    void sendEventLazily(std::string name, std::function<PropertyList()> builder) override;

private:
    struct Offer {
        std::string name;
        std::function<PropertyList()> builder;
    };

    void collect();
    bool isCollecting();
    void write(const EventFields& fields);
    bool hasRoomInFile();
    void writeToFile(const std::string& text);
    void writeToJournal(const std::string& text);

    Log& log_;
    const bool isScratch_;
    /// The file or the journal's socket.
    const std::string destination_;
    const std::shared_ptr<WorkQueue> queue_;
    const std::unique_ptr<Timer> timer_;
    // Owned by queue_.
    bool isFull_ = false;

    std::mutex mutex_;
    // Protected by mutex_.
    std::vector<Offer> offers_;
};

}  // namespace typhon
