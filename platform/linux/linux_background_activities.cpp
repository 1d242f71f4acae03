#include "platform/linux/linux_background_activities.h"

#include "platform/linux/directory_listing.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>

// An activity is due an interval after its last run, and up to a tenth of the interval later. One that never
// ran, or that became due while nobody ran it, is due within that tenth. On battery it is put off.

namespace typhon {

namespace {

constexpr const char* criteriaDirectory = "/etc/typhon/activities.d/";
constexpr const char* lastRunPrefix = "/var/mobile/Library/Preferences/com.vorlan.typhond.activity.";
constexpr PropertyListLimits fileLimits{.bytes = 16 * 1024, .depth = 2, .values = 32};
constexpr double shortestInterval = 60;
/// Of a scratch system, to see things happen.
constexpr double shortestScratchInterval = 1;
constexpr double longestInterval = 366.0 * 24 * 60 * 60;
constexpr std::size_t mostSupplies = 64;

class Call final : public BackgroundActivity {
public:
    explicit Call(std::int64_t state) : state_(state) {}
    std::int64_t state() const override { return state_; }

private:
    const std::int64_t state_;
};

PropertyList fileAt(const std::string& path)
{
    const auto opened = openRegularFile(path);
    auto reading = opened.error == 0 ? readPropertyListFromDescriptor(opened.file.get(), fileLimits)
                                     : PropertyListReading{};
    return reading.value ? *std::move(reading.value) : PropertyList();
}

ActivityCriteria criteriaFrom(const PropertyList& file, double shortest)
{
    ActivityCriteria criteria;
    const auto* interval = file.find("Interval");
    if (interval != nullptr && interval->asInteger() != nullptr) {
        criteria.intervalSeconds =
            std::clamp(static_cast<double>(*interval->asInteger()), shortest, longestInterval);
    }
    const auto* allowsBattery = file.find("AllowBattery");
    criteria.allowsBattery = allowsBattery != nullptr && allowsBattery->isTrue();
    return criteria;
}

std::string textAt(int directory, const std::string& name)
{
    const FileDescriptor file(::openat(directory, name.c_str(), O_RDONLY | O_CLOEXEC));
    const auto contents = file ? readWhole(file.get(), 256) : FileContents{};
    std::string text(contents.bytes.begin(), contents.bytes.end());
    text.erase(std::min(text.find('\n'), text.size()));
    return text;
}

}  // namespace

bool isOnBattery(const RootDirectory& root)
{
    const FileDescriptor supplies(
        ::open(root.real("/sys/class/power_supply").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!supplies) {
        return false;
    }
    const auto listing = listDirectory(supplies.get(), mostSupplies);
    auto names = listing.files;
    names.insert(names.end(), listing.directories.begin(), listing.directories.end());
    // A mouse has a battery too.
    return std::ranges::any_of(names, [&](const std::string& name) {
        return textAt(supplies.get(), name + "/type") == "Battery" &&
               textAt(supplies.get(), name + "/scope") != "Device" &&
               textAt(supplies.get(), name + "/status") == "Discharging";
    });
}

class LinuxBackgroundActivities::Registered final : public std::enable_shared_from_this<Registered> {
public:
    Registered(const Services& services, RootDirectory root, const std::string& name, Handler handler,
               WorkQueue& queue)
        : services_(services), root_(std::move(root)), lastRunPath_(lastRunPrefix + name + ".plist"),
          name_(name), handler_(std::move(handler)),
          criteria_(criteriaFrom(fileAt(root_.real(criteriaDirectory + name + ".plist")),
                                 root_.isScratch() ? shortestScratchInterval : shortestInterval)),
          queue_(queue)
    {}

    void checkIn()
    {
        timer_ = services_.queues.createTimer(queue_, [weak = weak_from_this()] {
            if (const auto self = weak.lock()) {
                self->becomeDue();
            }
        });
        handler_(Call(background_activity_states::checkIn));
        schedule();
    }

private:
    double lastRun() const
    {
        const auto file = fileAt(root_.real(lastRunPath_));
        const auto* date = file.find("LastRun");
        const auto seconds = date != nullptr && date->asDate() != nullptr ? date->asDate()->seconds : 0;
        // A clock that was set back must not put the activity off for long.
        return std::min(seconds, services_.clock.now());
    }
    void schedule()
    {
        const double spread = criteria_.intervalSeconds / 10 * services_.random();
        const double left = lastRun() + criteria_.intervalSeconds - services_.clock.now();
        arm(std::max(left, 0.0) + spread);
    }
    void arm(double seconds)
    {
        const std::chrono::duration<double> delay(seconds);
        timer_->schedule(std::chrono::duration_cast<std::chrono::nanoseconds>(delay),
                         std::chrono::seconds(1));
    }
    void becomeDue()
    {
        if (!criteria_.allowsBattery && isOnBattery(root_)) {
            arm(criteria_.intervalSeconds / 20);
            return;
        }
        const auto path = root_.real(lastRunPath_);
        auto error = makeDirectories(directoryOf(path), 0700);
        if (!error) {
            error = replaceFile(
                path,
                writeBinaryPropertyList(PropertyList::Dictionary{{"LastRun", Date{services_.clock.now()}}}),
                0600);
        }
        if (error) {
            TYLog_Error(services_.log, "the run of " + name_ + " is not remembered: " + *error);
        }
        handler_(Call(background_activity_states::run));
        arm(criteria_.intervalSeconds * (1 + services_.random() / 10));
    }

    const Services& services_;
    const RootDirectory root_;
    const std::string lastRunPath_;
    const std::string name_;
    const Handler handler_;
    const ActivityCriteria criteria_;
    WorkQueue& queue_;
    // Owned by the queue.
    std::unique_ptr<Timer> timer_;
};

LinuxBackgroundActivities::LinuxBackgroundActivities(Services services, RootDirectory root)
    : services_(std::move(services)), root_(std::move(root)),
      queue_(services_.queues.createSerialQueue("com.vorlan.typhond.activities"))
{}

LinuxBackgroundActivities::~LinuxBackgroundActivities() = default;

void LinuxBackgroundActivities::registerActivity(const std::string& name, Handler handler)
{
    const auto activity = std::make_shared<Registered>(services_, root_, name, std::move(handler), *queue_);
    {
        const std::lock_guard lock(mutex_);
        activities_.push_back(activity);
    }
    queue_->async([activity] { activity->checkIn(); });
}

}  // namespace typhon
