#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"
#include "sdk/font_grant.h"

#include <memory>
#include <string>

namespace typhon {

class ServiceConnection;

/// Opens font files: through the broker, to which it connects when the first is opened, or directly. One
/// thread at a time.
class FontOpener {
public:
    explicit FontOpener(RootDirectory root);
    FontOpener(FontOpener&&) noexcept;
    FontOpener& operator=(FontOpener&&) noexcept;
    ~FontOpener();

    /// A read-only descriptor of the file at the logical `path`.
    ClientResult<FileDescriptor> open(const FontGrant& grant, const std::string& path);
    /// The same through the broker, with that token.
    ClientResult<FileDescriptor> redeem(const Data& token, const std::string& path);
    const RootDirectory& root() const { return root_; }

private:
    ClientResult<FileDescriptor> openWithOwnAccess(const std::string& path) const;
    ClientResult<ServiceConnection*> broker();

    RootDirectory root_;
    std::unique_ptr<ServiceConnection> broker_;
};

}  // namespace typhon
