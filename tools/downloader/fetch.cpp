#include "tools/downloader/fetch.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <memory>
#include <optional>
#include <span>
#include <utility>

#include <arpa/inet.h>
#include <curl/curl.h>
#include <unistd.h>

// The library follows no redirection itself: each is judged here first. And whatever name a URL has, a
// connection without encryption is made to an address of this machine or not at all.

namespace typhon {

namespace {

using Clock = std::chrono::steady_clock;

constexpr int mostRedirections = 5;
constexpr long okStatus = 200;
constexpr long leastBytesPerSecond = 1;
constexpr long block = 64 << 10;
constexpr long patientBlock = 1 << 10;

bool isLoopbackAddress(const sockaddr* address)
{
    if (address->sa_family == AF_INET) {
        constexpr unsigned loopback = 127;
        const auto& internet = *reinterpret_cast<const sockaddr_in*>(address);
        return (ntohl(internet.sin_addr.s_addr) >> 24U) == loopback;
    }
    const auto& newer = *reinterpret_cast<const sockaddr_in6*>(address);
    return address->sa_family == AF_INET6 && IN6_IS_ADDR_LOOPBACK(&newer.sin6_addr);
}

/// One exchange with one server.
class Exchange {
public:
    Exchange(const DownloadUrl& url, const FetchOptions& options, int file, Clock::time_point deadline)
        : url_(url), options_(options), file_(file), handle_(::curl_easy_init(), ::curl_easy_cleanup)
    {
        setUp(deadline);
    }

    /// Empty, or why it failed.
    std::string run()
    {
        if (!handle_) {
            return "there is no memory for it";
        }
        const auto code = ::curl_easy_perform(handle_.get());
        if (code == CURLE_OK) {
            return {};
        }
        if (code == CURLE_OPERATION_TIMEDOUT && !isOverdue()) {
            return "nothing arrived for " + std::to_string(options_.stallSeconds) + " s";
        }
        return reasonOf(code);
    }
    long status() const
    {
        long status = 0;
        ::curl_easy_getinfo(handle_.get(), CURLINFO_RESPONSE_CODE, &status);
        return status;
    }
    std::optional<std::string> redirection() const
    {
        const char* target = nullptr;
        ::curl_easy_getinfo(handle_.get(), CURLINFO_REDIRECT_URL, &target);
        return target != nullptr ? std::optional<std::string>(target) : std::nullopt;
    }

private:
    template <typename Value>
    void set(CURLoption option, Value value)
    {
        ::curl_easy_setopt(handle_.get(), option, value);
    }

    void setUp(Clock::time_point deadline)
    {
        if (!handle_) {
            return;
        }
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
        end_ = deadline;
        set(CURLOPT_URL, url_.text.c_str());
        set(CURLOPT_PROTOCOLS_STR, url_.kind == DownloadUrl::Kind::https ? "https" : "http");
        set(CURLOPT_NOSIGNAL, 1L);
        set(CURLOPT_PROXY, "");
        set(CURLOPT_USERAGENT, "typhond");
        set(CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_1_1));
        set(CURLOPT_SSLVERSION, static_cast<long>(CURL_SSLVERSION_TLSv1_2));
        set(CURLOPT_CONNECTTIMEOUT, static_cast<long>(options_.stallSeconds));
        set(CURLOPT_LOW_SPEED_LIMIT, leastBytesPerSecond);
        set(CURLOPT_LOW_SPEED_TIME, static_cast<long>(options_.stallSeconds));
        set(CURLOPT_TIMEOUT_MS, static_cast<long>(std::max<std::int64_t>(left.count(), 1)));
        set(CURLOPT_MAXFILESIZE_LARGE, static_cast<curl_off_t>(options_.mostBytes));
        // The library takes up to a hundred such blocks before it looks at the speed.
        set(CURLOPT_BUFFERSIZE, options_.bytesPerSecond != 0 ? patientBlock : block);
        set(CURLOPT_MAX_RECV_SPEED_LARGE, static_cast<curl_off_t>(options_.bytesPerSecond));
        set(CURLOPT_ERRORBUFFER, error_.data());
        setCallbacks();
        if (!options_.certificates.empty()) {
            curl_blob blob{const_cast<std::uint8_t*>(options_.certificates.data()),
                           options_.certificates.size(), CURL_BLOB_NOCOPY};
            set(CURLOPT_CAINFO_BLOB, &blob);
        }
    }

    void setCallbacks()
    {
        set(CURLOPT_WRITEDATA, this);
        set(CURLOPT_WRITEFUNCTION, &Exchange::onBytes);
        set(CURLOPT_OPENSOCKETDATA, this);
        set(CURLOPT_OPENSOCKETFUNCTION, &Exchange::onSocket);
        set(CURLOPT_NOPROGRESS, 0L);
        set(CURLOPT_XFERINFODATA, this);
        set(CURLOPT_XFERINFOFUNCTION, &Exchange::onProgress);
    }

    static std::size_t onBytes(const char* bytes, std::size_t, std::size_t count, void* data)
    {
        return static_cast<Exchange*>(data)->keep({bytes, count}) ? count : 0;
    }
    static curl_socket_t onSocket(void* data, curlsocktype, curl_sockaddr* address)
    {
        const auto& self = *static_cast<Exchange*>(data);
        const bool isAllowed =
            self.url_.kind == DownloadUrl::Kind::https || isLoopbackAddress(&address->addr);
        return isAllowed ? ::socket(address->family, address->socktype | SOCK_CLOEXEC, address->protocol)
                         : CURL_SOCKET_BAD;
    }
    static int onProgress(void* data, curl_off_t, curl_off_t, curl_off_t, curl_off_t)
    {
        return static_cast<Exchange*>(data)->options_.isUnwanted() ? 1 : 0;
    }

    bool keep(std::span<const char> bytes)
    {
        if (bytes.size() > options_.mostBytes - kept_) {
            isTooLarge_ = true;
            return false;
        }
        kept_ += bytes.size();
        while (!bytes.empty()) {
            const auto written = ::write(file_, bytes.data(), bytes.size());
            if (written <= 0 && errno != EINTR) {
                return false;
            }
            bytes = bytes.subspan(written > 0 ? static_cast<std::size_t>(written) : 0);
        }
        return true;
    }

    /// The library counts in milliseconds, and not to the last of them.
    bool isOverdue() const { return Clock::now() >= end_ - std::chrono::milliseconds(100); }

    std::string reasonOf(CURLcode code) const
    {
        if (isTooLarge_ || code == CURLE_FILESIZE_EXCEEDED) {
            return "it is larger than " + std::to_string(options_.mostBytes) + " bytes";
        }
        if (code == CURLE_OPERATION_TIMEDOUT) {
            return "it was not there within " + std::to_string(options_.totalSeconds) + " s";
        }
        const std::string details(error_.data());
        return details.empty() ? ::curl_easy_strerror(code) : details;
    }

    const DownloadUrl& url_;
    const FetchOptions& options_;
    const int file_;
    const std::unique_ptr<CURL, decltype(&::curl_easy_cleanup)> handle_;
    Clock::time_point end_;
    std::array<char, CURL_ERROR_SIZE> error_{};
    std::uint64_t kept_ = 0;
    bool isTooLarge_ = false;
};

}  // namespace

std::string fetch(const DownloadUrl& first, const FetchOptions& options, int file)
{
    ::curl_global_init(CURL_GLOBAL_DEFAULT);
    const auto deadline = Clock::now() + std::chrono::seconds(options.totalSeconds);
    DownloadUrl url = first;
    for (int redirections = 0; redirections <= mostRedirections; ++redirections) {
        if (::ftruncate(file, 0) != 0 || ::lseek(file, 0, SEEK_SET) != 0) {
            return "there is no memory for it";
        }
        Exchange exchange(url, options, file, deadline);
        if (auto error = exchange.run(); !error.empty()) {
            return error;
        }
        const auto target = exchange.redirection();
        if (!target) {
            return exchange.status() == okStatus
                       ? std::string()
                       : "the server answers with status " + std::to_string(exchange.status());
        }
        auto next = readRedirection(url, *target);
        if (!next.url) {
            return next.error;
        }
        url = *std::move(next.url);
    }
    return "redirected more than " + std::to_string(mostRedirections) + " times";
}

}  // namespace typhon
