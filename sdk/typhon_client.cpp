#include "sdk/typhon_client.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/regular_file.h"
#include "sdk/client_errors.h"
#include "sdk/font_grant.h"
#include "sdk/service_connection.h"
#include "sdk/service_socket.h"

#include <cerrno>

#include <fcntl.h>

namespace typhon {

namespace {

constexpr const char* brokerService = "com.vorlan.typhond.file-access";
constexpr wire::Operation openFile{"com.vorlan.typhond.FileAccess", "open", "ays", "h"};

ClientResult<Done> withoutResults(const ClientResult<Arguments>& outcome)
{
    return outcome ? ClientResult<Done>(Done{}) : outcome.error();
}

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

ClientResult<TyphonClient> TyphonClient::connect(const Options& options)
{
    auto root = chosenRoot(options.root);
    auto daemon = ServiceConnection::open(root, wire::serviceName);
    if (!daemon) {
        return daemon.error();
    }
    return TyphonClient(std::move(root), std::move(*daemon));
}

TyphonClient::TyphonClient(RootDirectory root, ServiceConnection daemon)
    : root_(std::move(root)), daemon_(std::make_unique<ServiceConnection>(std::move(daemon)))
{}

TyphonClient::TyphonClient(TyphonClient&&) noexcept = default;
TyphonClient& TyphonClient::operator=(TyphonClient&&) noexcept = default;
TyphonClient::~TyphonClient() = default;

ClientResult<std::optional<PropertyList>> TyphonClient::checkin()
{
    return checkinWith(wire::checkin);
}

ClientResult<std::optional<PropertyList>> TyphonClient::checkinForFontPicker()
{
    return checkinWith(wire::checkinForFontPicker);
}

ClientResult<std::optional<PropertyList>> TyphonClient::checkinWith(const wire::Operation& operation)
{
    const auto outcome = call(operation, {});
    if (!outcome) {
        return outcome.error();
    }
    lastCheckin_ = wire::fromNullable(std::get<PropertyList>(outcome->front()));
    return lastCheckin_;
}

ClientResult<Done> TyphonClient::updatingUserFonts()
{
    return withoutResults(call(wire::updatingUserFonts, {}));
}

ClientResult<Done> TyphonClient::resetIssuedFontsFor(const std::string& identifier)
{
    return withoutResults(call(wire::resetIssuedFontsFor, {PropertyList(identifier)}));
}

ClientResult<Arguments> TyphonClient::call(const wire::Operation& operation, const Arguments& arguments)
{
    return daemon_->call(operation, arguments);
}

ClientResult<FileDescriptor> TyphonClient::openFont(const std::string& path)
{
    const auto grant = fontGrantFor(lastCheckin_.value_or(PropertyList()), path);
    return grant.way == FontGrant::Way::ownAccess ? openWithOwnAccess(path) : redeem(grant.token, path);
}

ClientResult<FileDescriptor> TyphonClient::redeem(const Data& token, const std::string& path)
{
    const auto service = broker();
    if (!service) {
        return service.error();
    }
    const auto outcome = (*service)->call(openFile, {PropertyList(token), PropertyList(path)});
    return outcome ? ownDescriptor(outcome->front()) : outcome.error();
}

ClientResult<FileDescriptor> TyphonClient::openWithOwnAccess(const std::string& path) const
{
    const auto real = root_.real(path);
    auto opened = openRegularFile(real);
    if (opened.error != 0) {
        return systemError(opened.error, "cannot open " + real);
    }
    return std::move(opened.file);
}

ClientResult<ServiceConnection*> TyphonClient::broker()
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
