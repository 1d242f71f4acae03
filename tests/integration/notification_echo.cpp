#include "platform/linux/event_pool.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_notifications.h"
#include "platform/linux/linux_work_queues.h"
#include "tools/property_list_json.h"

#include <iostream>
#include <string>

// notification-echo ROOT: prints every event that reaches a service of typhon, as JSON, one a line, with its
// stream under "stream", and posts every name that it reads from standard input. Logs as the daemon does.

namespace {

using namespace typhon;

void echo(Notifications& notifications, const std::string& stream, const std::shared_ptr<WorkQueue>& queue)
{
    notifications.setEventStreamHandler(stream, queue, [stream](const PropertyList& event) {
        auto json = jsonOf(event);
        json["stream"] = stream;
        std::cout << json.dump() << std::endl;
    });
}

}  // namespace

int main(int, char** arguments)
{
    LinuxLog log(LogLevel::debug, LinuxLog::Destination::descriptor);
    EventPool pool;
    LinuxWorkQueues queues(pool);
    LinuxNotifications notifications(pool, queues, log, RootDirectory(arguments[1]));
    const auto queue = queues.createSerialQueue("notification-echo");
    echo(notifications, event_streams::notifyCentre, queue);
    echo(notifications, event_streams::distributed, queue);
    notifications.start();
    for (std::string name; std::getline(std::cin, name);) {
        notifications.postNotifyCentreNotification(name);
    }
    pool.stop();
}
