#include "sdk/web_content_process.h"

#include "sdk/endpoint_listener.h"
#include "sdk/font_grant.h"
#include "sdk/font_opener.h"
#include "sdk/service_socket.h"
#include "sdk/waiting.h"

#include <utility>

namespace typhon {

struct WebContentProcess::Parts {
    Parts(EndpointListener endpointListener, RootDirectory root)
        : listener(std::move(endpointListener)), opener(std::move(root))
    {}

    void handle(const PeerCall& call);
    void processAll();

    EndpointListener listener;
    FontOpener opener;
    std::optional<Fonts> received;
    PropertyList latest;
};

void WebContentProcess::Parts::handle(const PeerCall& call)
{
    if (call.argumentsOf(wire::pingSilkpageProcess)) {
        call.reply();
    } else if (const auto fonts = call.argumentsOf(wire::userInstalledFontsInfo)) {
        received = Fonts{wire::fromNullable(std::get<PropertyList>(fonts->front()))};
        latest = received->info.value_or(PropertyList());
        call.reply();
    } else {
        call.refuse();
    }
}

void WebContentProcess::Parts::processAll()
{
    listener.process([this](const PeerCall& call) { handle(call); });
}

ClientResult<WebContentProcess> WebContentProcess::listen(const Options& options)
{
    auto root = chosenRoot(options.root);
    auto listener = EndpointListener::listen(root);
    if (!listener) {
        return listener.error();
    }
    return WebContentProcess(std::make_unique<Parts>(std::move(*listener), std::move(root)));
}

WebContentProcess::WebContentProcess(std::unique_ptr<Parts> parts) : parts_(std::move(parts)) {}
WebContentProcess::WebContentProcess(WebContentProcess&&) noexcept = default;
WebContentProcess& WebContentProcess::operator=(WebContentProcess&&) noexcept = default;
WebContentProcess::~WebContentProcess() = default;

const FileDescriptor& WebContentProcess::endpoint() const
{
    return parts_->listener.endpoint();
}

ClientResult<std::optional<WebContentProcess::Fonts>>
WebContentProcess::waitForFonts(std::optional<std::chrono::milliseconds> timeout)
{
    const auto deadline = deadlineAfter(timeout);
    for (;;) {
        parts_->processAll();
        if (parts_->received) {
            return std::exchange(parts_->received, std::nullopt);
        }
        const auto waited = waitFor(parts_->listener.descriptors(), deadline);
        if (!waited) {
            return waited.error();
        }
        if (!*waited) {
            return std::optional<Fonts>();
        }
    }
}

ClientResult<FileDescriptor> WebContentProcess::openFont(const std::string& path)
{
    return parts_->opener.open(fontGrantFor(parts_->latest, path), path);
}

}  // namespace typhon
