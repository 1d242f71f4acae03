#pragma once

#include "platform/analytics.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>

namespace typhon {

/// Analytics on Linux. On a machine events go to the journal, each as one entry with fields of its own; in a
/// scratch system to the file `eventsPath`, in the journal's export format. Where there is no journal nobody
/// collects, and nothing is built. An event that cannot be written is dropped. Any thread; writes at once, on
/// the caller's.
class LinuxAnalytics final : public Analytics {
public:
    /// Of a scratch system. Gone with the boot, like the journal's share of it.
    static constexpr const char* eventsPath = "/run/typhon/analytics.export";
    static constexpr const char* journalSocket = "/run/systemd/journal/socket";
    /// Beyond this the file takes no more.
    static constexpr std::int64_t largestFile = 16 << 20;

    /// `log` outlives this. `socket`: the journal's.
    LinuxAnalytics(const RootDirectory& root, Log& log, std::string socket = journalSocket);

    void sendEventLazily(std::string name, std::function<PropertyList()> builder) override;

private:
    bool isCollecting();
    bool hasRoomInFile();
    void writeToFile(const std::string& text);
    void writeToJournal(const std::string& text);

    Log& log_;
    const bool isScratch_;
    /// The file or the journal's socket.
    const std::string destination_;
    std::mutex writing_;
    std::atomic<bool> isFull_{false};
};

}  // namespace typhon
