#include "platform/linux/downloads.h"
#include "platform/linux/scratch_directory.h"

#include <csignal>
#include <future>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using ::testing::HasSubstr;

constexpr auto patience = 60s;

/// A program in the place of the downloader writes down the requests it gets, and then only waits.
class DownloadsTest : public testing::Test {
protected:
    DownloadsTest()
    {
        scratch.writeFile("/program", "#!/bin/sh\n"
                                      "dd bs=16384 count=1 2>/dev/null >>" +
                                          scratch.real("/requests") +
                                          "\n"
                                          "echo $$ >" +
                                          scratch.real("/begun") +
                                          "\n"
                                          "exec sleep 1000\n");
        ::chmod(scratch.real("/program").c_str(), 0700);
        ::mkfifo(scratch.real("/begun").c_str(), 0600);
    }
    ~DownloadsTest() override { pool.stop(); }

    static DownloadRequest request(const std::string& url, std::uint32_t totalSeconds = 600)
    {
        DownloadRequest request;
        request.url = url;
        request.totalSeconds = totalSeconds;
        return request;
    }
    std::future<std::string> start(Downloads& downloads, const std::string& url, bool discretionary = false)
    {
        auto promise = std::make_shared<std::promise<std::string>>();
        downloads.start(request(url), discretionary,
                        [promise](const DownloadAnswer& answer) { promise->set_value(answer.error); });
        return promise->get_future();
    }
    static std::string errorOf(std::future<std::string>& future)
    {
        EXPECT_EQ(future.wait_for(patience), std::future_status::ready);
        return future.get();
    }
    /// The process that begins next; blocks until one does. Two must not begin at the same time.
    pid_t waitUntilBegun() const { return std::stoi(scratch.readFile("/begun")); }
    static void end(pid_t process) { ::kill(process, SIGKILL); }
    bool wasAsked(const std::string& url) const
    {
        return scratch.readFile("/requests").find(url) != std::string::npos;
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    EventPool pool;
};

TEST_F(DownloadsTest, AProgramThatEndsWithoutAnAnswerIsAnError)
{
    Downloads downloads(pool, root, "/bin/true");
    auto first = start(downloads, "a");
    EXPECT_THAT(errorOf(first), HasSubstr("the downloader end"));
}

TEST_F(DownloadsTest, AProgramThatCannotBeStartedIsAnError)
{
    Downloads downloads(pool, root, scratch.real("/nowhere"));
    auto first = start(downloads, "a");
    EXPECT_THAT(errorOf(first), HasSubstr("cannot start the downloader"));
}

TEST_F(DownloadsTest, AProgramThatDoesNotAnswerIsEnded)
{
    Downloads downloads(pool, root, scratch.real("/program"));
    std::promise<std::string> promise;
    auto future = promise.get_future();
    downloads.start(request("a", 0), false,
                    [&promise](const DownloadAnswer& answer) { promise.set_value(answer.error); });
    EXPECT_EQ(errorOf(future), "the downloader does not answer within 5 s");
}

TEST_F(DownloadsTest, ADiscretionaryDownloadWaitsUntilNoOtherRuns)
{
    Downloads downloads(pool, root, scratch.real("/program"));
    auto urgent = start(downloads, "the-urgent-one");
    const auto first = waitUntilBegun();
    auto patient = start(downloads, "the-patient-one", true);
    auto another = start(downloads, "another-urgent-one");
    const auto second = waitUntilBegun();
    EXPECT_FALSE(wasAsked("the-patient-one"));
    end(first);
    end(second);
    errorOf(urgent);
    errorOf(another);
    const auto last = waitUntilBegun();
    EXPECT_TRUE(wasAsked("the-patient-one"));
    end(last);
    errorOf(patient);
}

TEST_F(DownloadsTest, FewRunAtATimeAndWhatIsBeyondTheLineIsRefused)
{
    Downloads downloads(pool, root, scratch.real("/program"));
    std::vector<std::future<std::string>> running;
    pid_t last = -1;
    for (std::size_t number = 0; number < Downloads::mostRunning; ++number) {
        running.push_back(start(downloads, "running"));
        last = waitUntilBegun();
    }
    for (std::size_t number = 0; number < Downloads::mostWaiting; ++number) {
        start(downloads, "waiting");
    }
    auto beyond = start(downloads, "beyond");
    EXPECT_EQ(errorOf(beyond), "too many downloads are waiting");
    EXPECT_FALSE(wasAsked("waiting"));
    end(last);
    waitUntilBegun();
    EXPECT_TRUE(wasAsked("waiting"));
}

TEST_F(DownloadsTest, NothingIsCalledAfterTheEnd)
{
    bool isCalled = false;
    {
        Downloads downloads(pool, root, scratch.real("/program"));
        downloads.start(request("a"), false, [&isCalled](const DownloadAnswer&) { isCalled = true; });
        waitUntilBegun();
    }
    pool.stop();
    EXPECT_FALSE(isCalled);
}

}  // namespace
}  // namespace typhon
