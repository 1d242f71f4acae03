#include "clients/notification_center.h"

#include <array>
#include <cstddef>
#include <new>

#include <gtest/gtest.h>

namespace typhon {
namespace {

struct Observer {
    explicit Observer(std::vector<std::string>& heardBy, std::string ownName)
        : heard(heardBy), name(std::move(ownName))
    {}
    void receive(const PropertyList& payload) { heard.push_back(name + " " + *payload.asString()); }

    std::vector<std::string>& heard;
    std::string name;
};

class NotificationCenterTest : public testing::Test {
protected:
    std::shared_ptr<Observer> add(const std::string& name, const std::string& notification = "fontChanged")
    {
        auto observer = std::make_shared<Observer>(heard, name);
        center.addObserver(observer, notification, &Observer::receive);
        return observer;
    }

    std::vector<std::string> heard;
    NotificationCenter center;
};

TEST_F(NotificationCenterTest, ObserversHearANotificationOneAfterAnotherBeforePostReturns)
{
    const auto second = add("zeta");
    const auto first = add("alpha");
    center.post("fontChanged", "now");
    EXPECT_EQ(heard, (std::vector<std::string>{"zeta now", "alpha now"}));
}

TEST_F(NotificationCenterTest, OnlyObserversOfThatNameHear)
{
    const auto other = add("other", "somethingElse");
    center.post("fontChanged", "now");
    EXPECT_TRUE(heard.empty());
    EXPECT_TRUE(center.hasObserver(other.get(), "somethingElse"));
    EXPECT_FALSE(center.hasObserver(other.get(), "fontChanged"));
}

TEST_F(NotificationCenterTest, AnObserverThatIsGoneIsSkippedAndNotKeptAlive)
{
    auto observer = add("gone");
    const std::weak_ptr<Observer> weak = observer;
    observer.reset();
    EXPECT_TRUE(weak.expired());
    center.post("fontChanged", "now");
    EXPECT_TRUE(heard.empty());
}

TEST_F(NotificationCenterTest, AnObserverInTheMemoryOfOneThatIsGoneIsAnotherOne)
{
    alignas(Observer) std::array<std::byte, sizeof(Observer)> memory{};
    const auto make = [&](const std::string& name) {
        return std::shared_ptr<Observer>(new (memory.data()) Observer(heard, name),
                                         [](Observer* observer) { observer->~Observer(); });
    };
    center.addObserver(make("first"), "fontChanged", &Observer::receive);
    const auto second = make("second");
    center.addObserver(second, "fontChanged", &Observer::receive);
    center.post("fontChanged", "now");
    EXPECT_EQ(heard, std::vector<std::string>{"second now"});
    EXPECT_EQ(center.observerCount("fontChanged"), 1U);
}

TEST_F(NotificationCenterTest, ARemovedObserverHearsNothing)
{
    const auto observer = add("removed");
    center.addObserver(observer, "other", &Observer::receive);
    center.removeObserver(observer.get());
    center.post("fontChanged", "now");
    center.post("other", "now");
    EXPECT_TRUE(heard.empty());
    EXPECT_EQ(center.observerCount("fontChanged"), 0U);
}

TEST_F(NotificationCenterTest, AddingAnObserverAgainChangesNothing)
{
    const auto observer = add("once");
    center.addObserver(observer, "fontChanged", &Observer::receive);
    EXPECT_EQ(center.observerCount("fontChanged"), 1U);
    center.post("fontChanged", "now");
    EXPECT_EQ(heard, std::vector<std::string>{"once now"});
}

struct Leaver : std::enable_shared_from_this<Leaver> {
    explicit Leaver(NotificationCenter& leftCenter) : center(leftCenter) {}
    void receive(const PropertyList&) { center.removeObserver(this); }
    NotificationCenter& center;
};

TEST_F(NotificationCenterTest, AnObserverMayLeaveWhileItIsCalled)
{
    const auto leaver = std::make_shared<Leaver>(center);
    center.addObserver(leaver, "fontChanged", &Leaver::receive);
    center.post("fontChanged", "now");
    EXPECT_EQ(center.observerCount("fontChanged"), 0U);
}

}  // namespace
}  // namespace typhon
