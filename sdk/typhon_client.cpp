#include "sdk/typhon_client.h"

#include "platform/linux/bus_message.h"
#include "sdk/client_errors.h"
#include "sdk/font_grant.h"
#include "sdk/font_opener.h"
#include "sdk/received_changes.h"
#include "sdk/service_connection.h"
#include "sdk/service_socket.h"
#include "sdk/waiting.h"

#include <cerrno>

#include <fcntl.h>

namespace typhon {

namespace {

ClientResult<Done> withoutResults(const ClientResult<Arguments>& outcome)
{
    return outcome ? ClientResult<Done>(Done{}) : outcome.error();
}

void receive(ReceivedChanges& changes, const PeerCall& call)
{
    if (const auto arguments = call.argumentsOf(wire::fontAddedInfo)) {
        changes.add(*arguments);
    } else {
        call.refuse();
    }
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
    : daemon_(std::make_unique<ServiceConnection>(std::move(daemon))),
      opener_(std::make_unique<FontOpener>(std::move(root))), changes_(std::make_unique<ReceivedChanges>())
{
    daemon_->setCallHandler([changes = changes_.get()](const PeerCall& call) { receive(*changes, call); });
}

TyphonClient::TyphonClient(TyphonClient&&) noexcept = default;
TyphonClient& TyphonClient::operator=(TyphonClient&&) noexcept = default;
TyphonClient::~TyphonClient() = default;

const RootDirectory& TyphonClient::root() const
{
    return opener_->root();
}

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
    // Before the call: a change that comes right behind the answer is not part of it.
    changes_->forgetGrants();
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

ClientResult<Done> TyphonClient::scheduleFontFilesDeletion(const std::vector<std::string>& paths)
{
    return withoutResults(call(wire::scheduleFontFilesDeletion, {arrayOfStrings(paths)}));
}

ClientResult<Done> TyphonClient::resetIssuedFontsFor(const std::string& identifier)
{
    return withoutResults(call(wire::resetIssuedFontsFor, {PropertyList(identifier)}));
}

ClientResult<Done> TyphonClient::fontChanged(const std::vector<std::string>& urls, bool added, int kind)
{
    const PropertyList change =
        PropertyList::Dictionary{{"urls", arrayOfStrings(urls)}, {"added", added}, {"kind", kind}};
    return withoutResults(call(wire::fontChanged, {change}));
}

ClientResult<std::optional<FontChangeNotice>>
TyphonClient::waitForChange(std::optional<std::chrono::milliseconds> timeout)
{
    const auto deadline = deadlineAfter(timeout);
    for (;;) {
        const auto processed = daemon_->process();
        auto change = changes_->take();
        if (change) {
            return change;
        }
        if (!processed) {
            return processed.error();
        }
        const auto waited = waitFor({{daemon_->descriptor(), daemon_->events(), 0}}, deadline);
        if (!waited) {
            return waited.error();
        }
        if (!*waited) {
            return std::optional<FontChangeNotice>();
        }
    }
}

ClientResult<std::vector<FontChangeNotice>> TyphonClient::processPending()
{
    const auto processed = daemon_->process();
    std::vector<FontChangeNotice> changes;
    while (auto change = changes_->take()) {
        changes.push_back(*std::move(change));
    }
    if (!processed && changes.empty()) {
        return processed.error();
    }
    return changes;
}

int TyphonClient::descriptor() const
{
    return daemon_->descriptor();
}

std::size_t TyphonClient::lostChanges() const
{
    return changes_->lost();
}

ClientResult<Done> TyphonClient::checkinForSilkpageProcess(const FileDescriptor& endpoint,
                                                           std::optional<std::chrono::milliseconds> timeout)
{
    FileDescriptor copy(::fcntl(endpoint.get(), F_DUPFD_CLOEXEC, 3));
    if (!copy) {
        return systemError(errno, "cannot pass the endpoint on");
    }
    std::shared_ptr<TransferredFile> file = std::make_shared<LinuxTransferredFile>(std::move(copy));
    return withoutResults(daemon_->call(wire::checkinForSilkpageProcess, {std::move(file)}, timeout));
}

ClientResult<Arguments> TyphonClient::call(const wire::Operation& operation, const Arguments& arguments)
{
    return daemon_->call(operation, arguments);
}

ClientResult<FileDescriptor> TyphonClient::openFont(const std::string& path)
{
    auto grant = fontGrantFor(lastCheckin_.value_or(PropertyList()), path);
    if (grant.way == FontGrant::Way::broker && grant.token.bytes.empty()) {
        grant = fontGrantFor(changes_->grants(), path);
    }
    return opener_->open(grant, path);
}

ClientResult<FileDescriptor> TyphonClient::redeem(const Data& token, const std::string& path)
{
    return opener_->redeem(token, path);
}

}  // namespace typhon
