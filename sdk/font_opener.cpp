#include "sdk/font_opener.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/regular_file.h"
#include "sdk/client_errors.h"
#include "sdk/service_connection.h"

#include <cerrno>

#include <fcntl.h>

namespace typhon {

namespace {

constexpr const char* brokerService = "com.vorlan.typhond.file-access";
constexpr wire::Operation openFile{"com.vorlan.typhond.FileAccess", "open", "ays", "h"};

/// The descriptor of an `h` argument, for the caller to own.
ClientResult<FileDescriptor> ownDescriptor(const Argument& argument)
{
    const auto& file = std::get<std::shared_ptr<TransferredFile>>(argument);
    const auto received = std::dynamic_pointer_cast<LinuxTransferredFile>(file);
    FileDescriptor own(received ? ::fcntl(received->descriptor.get(), F_DUPFD_CLOEXEC, 3) : -1);
    if (!own) {
        return systemError(errno, "cannot keep the received file");
    }
    return own;
}

}  // namespace

FontOpener::FontOpener(RootDirectory root) : root_(std::move(root)) {}
FontOpener::FontOpener(FontOpener&&) noexcept = default;
FontOpener& FontOpener::operator=(FontOpener&&) noexcept = default;
FontOpener::~FontOpener() = default;

ClientResult<FileDescriptor> FontOpener::open(const FontGrant& grant, const std::string& path)
{
    return grant.way == FontGrant::Way::ownAccess ? openWithOwnAccess(path) : redeem(grant.token, path);
}

ClientResult<FileDescriptor> FontOpener::redeem(const Data& token, const std::string& path)
{
    const auto service = broker();
    if (!service) {
        return service.error();
    }
    const auto outcome = (*service)->call(openFile, {PropertyList(token), PropertyList(path)});
    return outcome ? ownDescriptor(outcome->front()) : outcome.error();
}

ClientResult<FileDescriptor> FontOpener::openWithOwnAccess(const std::string& path) const
{
    const auto real = root_.real(path);
    auto opened = openRegularFile(real);
    if (opened.error != 0) {
        return systemError(opened.error, "cannot open " + real);
    }
    return std::move(opened.file);
}

ClientResult<ServiceConnection*> FontOpener::broker()
{
    if (!broker_ || !broker_->isOpen()) {
        auto made = ServiceConnection::open(root_, brokerService);
        if (!made) {
            return made.error();
        }
        broker_ = std::make_unique<ServiceConnection>(std::move(*made));
    }
    return broker_.get();
}

}  // namespace typhon
