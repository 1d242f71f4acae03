#include "platform/linux/downloads.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>
#include <future>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;
using ::testing::HasSubstr;

constexpr auto patience = 60s;

/// A program in the place of the downloader writes down the requests it gets, and ends when it is told to.
class DownloadsTest : public testing::Test {
protected:
    DownloadsTest()
    {
        scratch.writeFile("/program", "#!/bin/sh\n"
                                      "dd bs=16384 count=1 2>/dev/null >>" +
                                          scratch.real("/requests") +
                                          "\n"
                                          "echo begun >" +
                                          scratch.real("/begun") +
                                          "\n"
                                          "read line <" +
                                          scratch.real("/end") + "\n");
        ::chmod(scratch.real("/program").c_str(), 0700);
        for (const auto* name : {"/begun", "/end"}) {
            ::mkfifo(scratch.real(name).c_str(), 0600);
        }
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
    /// Both block until the program is at the other end of the pipe.
    void waitUntilBegun() const { EXPECT_EQ(scratch.readFile("/begun"), "begun\n"); }
    void endOne() const { scratch.writeFile("/end", "end\n"); }
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
    waitUntilBegun();
    EXPECT_EQ(errorOf(future), "the downloader does not answer within 5 s");
}

TEST_F(DownloadsTest, ADiscretionaryDownloadWaitsUntilNoOtherRuns)
{
    Downloads downloads(pool, root, scratch.real("/program"));
    auto urgent = start(downloads, "the-urgent-one");
    waitUntilBegun();
    auto patient = start(downloads, "the-patient-one", true);
    auto another = start(downloads, "another-urgent-one");
    waitUntilBegun();
    EXPECT_FALSE(wasAsked("the-patient-one"));
    endOne();
    endOne();
    errorOf(urgent);
    errorOf(another);
    waitUntilBegun();
    EXPECT_TRUE(wasAsked("the-patient-one"));
    endOne();
    errorOf(patient);
}

TEST_F(DownloadsTest, FewRunAtATimeAndWhatIsBeyondTheLineIsRefused)
{
    Downloads downloads(pool, root, scratch.real("/program"));
    std::vector<std::future<std::string>> running;
    for (std::size_t number = 0; number < Downloads::mostRunning; ++number) {
        running.push_back(start(downloads, "running"));
        waitUntilBegun();
    }
    for (std::size_t number = 0; number < Downloads::mostWaiting; ++number) {
        start(downloads, "waiting");
    }
    auto beyond = start(downloads, "beyond");
    EXPECT_EQ(errorOf(beyond), "too many downloads are waiting");
    EXPECT_FALSE(wasAsked("waiting"));
    endOne();
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
