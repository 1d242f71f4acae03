#pragma once

#include "platform/audit_token.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// Makes and checks the texts that grant one process read access to a file, or to all files beneath a
/// directory. They are authenticated with a key that lives and dies with this object, so nobody else can make
/// one, and an earlier daemon's are told apart. `const` means safe to share between threads.
class ExtensionTokens {
public:
    enum class Verdict { granted, refused, expired };

    /// Draws a new key.
    ExtensionTokens();
    ~ExtensionTokens();
    ExtensionTokens(const ExtensionTokens&) = delete;
    ExtensionTokens& operator=(const ExtensionTokens&) = delete;

    /// A token for `path` that `target` can use; different at every call. Null when the path is not within
    /// the font trees.
    std::optional<std::string> issue(const AuditToken& target, std::string_view path) const;

    /// Whether `token` lets `bearer` read the file at the plain path `path`. `expired` for an undamaged token
    /// of another instance of the daemon.
    Verdict check(std::string_view token, const AuditToken& bearer, std::string_view path) const;

private:
    std::array<std::uint8_t, 32> key_{};
    /// Names this object, in hexadecimal.
    std::string instance_;
};

}  // namespace typhon
