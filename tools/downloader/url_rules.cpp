#include "tools/downloader/url_rules.h"

#include <memory>
#include <string_view>

#include <arpa/inet.h>
#include <curl/curl.h>

namespace typhon {

namespace {

/// A part of a URL; empty when it has none.
std::string part(CURLU* url, CURLUPart which, unsigned flags = 0)
{
    char* text = nullptr;
    if (::curl_url_get(url, which, &text, flags) != CURLUE_OK) {
        return {};
    }
    const std::unique_ptr<char, decltype(&::curl_free)> owned(text, ::curl_free);
    return text;
}

/// Names are left to the resolver, except for the one that means this machine.
bool isLoopback(const std::string& host)
{
    if (host == "localhost" || host == "[::1]") {
        return true;
    }
    in_addr address{};
    constexpr unsigned loopback = 127;
    return ::inet_pton(AF_INET, host.c_str(), &address) == 1 && (ntohl(address.s_addr) >> 24U) == loopback;
}

UrlReading refuse(const std::string& why)
{
    return {std::nullopt, why};
}

}  // namespace

UrlReading readUrl(const std::string& text)
{
    const std::unique_ptr<CURLU, decltype(&::curl_url_cleanup)> url(::curl_url(), ::curl_url_cleanup);
    if (!url ||
        ::curl_url_set(url.get(), CURLUPART_URL, text.c_str(), CURLU_NON_SUPPORT_SCHEME) != CURLUE_OK) {
        return refuse("it is no URL that can be understood");
    }
    const auto scheme = part(url.get(), CURLUPART_SCHEME);
    if (!part(url.get(), CURLUPART_USER).empty() || !part(url.get(), CURLUPART_PASSWORD).empty()) {
        return refuse("a URL with a name or password is refused");
    }
    if (scheme == "https") {
        return {DownloadUrl{DownloadUrl::Kind::https, text, {}}, {}};
    }
    if (scheme == "http") {
        return isLoopback(part(url.get(), CURLUPART_HOST))
                   ? UrlReading{DownloadUrl{DownloadUrl::Kind::loopbackHttp, text, {}}, {}}
                   : refuse("http is for this machine only, others need https");
    }
    auto path = part(url.get(), CURLUPART_PATH, CURLU_URLDECODE);
    if (scheme == "file" && path.starts_with('/')) {
        return {DownloadUrl{DownloadUrl::Kind::file, text, std::move(path)}, {}};
    }
    return refuse("a URL of \"" + scheme + "\" is refused");
}

UrlReading readRedirection(const DownloadUrl& from, const std::string& text)
{
    auto reading = readUrl(text);
    if (!reading.url) {
        return refuse("redirected to what is refused: " + reading.error);
    }
    const bool isWorse =
        reading.url->kind == DownloadUrl::Kind::file ||
        (from.kind == DownloadUrl::Kind::https && reading.url->kind != DownloadUrl::Kind::https);
    return isWorse ? refuse("redirected to what is refused: from https to http, or to a file") : reading;
}

}  // namespace typhon
