#include "assets/asset_directory_monitoring.h"

#include "platform/font_directories.h"

#include <chrono>

namespace typhon {

namespace {

constexpr std::chrono::seconds latency{3};
/// What a log line shows of the paths.
constexpr std::size_t longestDescription = 4000;

std::string descriptionOf(const std::vector<std::string>& paths)
{
    std::string text = "(";
    for (const auto& path : paths) {
        text += (text.size() == 1 ? "\"" : ", \"") + path + "\"";
        if (text.size() > longestDescription) {
            return text + ", ... of " + std::to_string(paths.size()) + ")";
        }
    }
    return text + ")";
}

}  // namespace

void AssetDirectoryMonitoring::setupForMonitoringFontAssets()
{
    const auto queue = platform_.queues.createSerialQueue("com.vorlan.typhond.fontAssetsMonitor");
    {
        const std::lock_guard lock(mutex_);
        monitorQueue_ = queue;
    }
    queue->async([weak = weak_from_this()] {
        if (const auto self = weak.lock()) {
            self->startUp();
        }
    });
}

void AssetDirectoryMonitoring::startUp()
{
    platform_.userFontManager.synchronizeFontAssets([weak = weak_from_this()](bool) {
        if (const auto self = weak.lock()) {
            self->startWatching();
        }
    });
}

void AssetDirectoryMonitoring::startWatching()
{
    const auto stream =
        platform_.fileEvents.createStream({std::string(font_directories::assetStore)}, latency,
                                          [weak = weak_from_this()](const std::vector<std::string>& paths) {
                                              if (const auto self = weak.lock()) {
                                                  self->handleChanges(paths);
                                              }
                                          });
    const std::lock_guard lock(mutex_);
    stream_ = stream;
    stream->setDispatchQueue(monitorQueue_);
    stream->start();
}

void AssetDirectoryMonitoring::handleChanges(const std::vector<std::string>& paths)
{
    TYLog_Debug(platform_.log, "FontAssetsEventStreamCallback - " + descriptionOf(paths));
    platform_.userFontManager.synchronizeFontAssets([&log = platform_.log](bool success) {
        TYLog_Debug(log, std::string("synchronizeFontAssets result - ") + (success ? "success" : "fail"));
    });
}

}  // namespace typhon
