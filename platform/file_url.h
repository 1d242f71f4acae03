#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// The longest path that a file URL may name, in bytes. A path that the system can open is shorter.
inline constexpr std::size_t longestFileUrlPath = 4096;

/// The file URL of an absolute path, "file:///..." with everything percent-encoded that does not stand for
/// itself in a URL. Any bytes are a path; what is not absolute gives a URL that names no file.
std::string fileUrlFromPath(std::string_view path);

/// The path that a file URL names, or null for whatever is no valid one: another scheme, a host other than
/// none or "localhost", a path that is not absolute, a query or fragment, characters that a URL must encode,
/// a broken escape or one that stands for a zero byte or a slash, more than `longestFileUrlPath` bytes of
/// path. Scheme and host may be in either case, and the two slashes before the host may be missing with it.
/// "." and ".." are kept as they are.
std::optional<std::string> pathFromFileUrl(std::string_view url);

}  // namespace typhon
