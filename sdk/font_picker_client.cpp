#include "sdk/font_picker_client.h"

#include "sdk/endpoint_listener.h"
#include "sdk/font_grant.h"
#include "sdk/font_opener.h"
#include "sdk/service_socket.h"
#include "sdk/waiting.h"

#include <utility>

namespace typhon {

struct FontPickerClient::Parts {
    Parts(EndpointListener endpointListener, RootDirectory root)
        : listener(std::move(endpointListener)), opener(std::move(root))
    {}

    /// True when it was about fonts.
    bool handle(const PeerCall& call, const Activate& activate);

    EndpointListener listener;
    FontOpener opener;
    PropertyList latest;
};

bool FontPickerClient::Parts::handle(const PeerCall& call, const Activate& activate)
{
    if (const auto text = call.argumentsOf(wire::pingFontPickerClient)) {
        call.reply(wire::pingFontPickerClient, {text->front()});
        return false;
    }
    const auto fonts = call.argumentsOf(wire::activateFontsForFontPickerClient);
    if (!fonts) {
        call.refuse();
        return false;
    }
    const auto& info = std::get<PropertyList>(fonts->front());
    latest = PropertyList::Dictionary{{"fontsInfo", info}};
    call.reply(wire::activateFontsForFontPickerClient, {PropertyList(activate(info))});
    return true;
}

ClientResult<FontPickerClient> FontPickerClient::listen(const Options& options)
{
    auto root = chosenRoot(options.root);
    auto listener = EndpointListener::listen(root);
    if (!listener) {
        return listener.error();
    }
    return FontPickerClient(std::make_unique<Parts>(std::move(*listener), std::move(root)));
}

FontPickerClient::FontPickerClient(std::unique_ptr<Parts> parts) : parts_(std::move(parts)) {}
FontPickerClient::FontPickerClient(FontPickerClient&&) noexcept = default;
FontPickerClient& FontPickerClient::operator=(FontPickerClient&&) noexcept = default;
FontPickerClient::~FontPickerClient() = default;

const FileDescriptor& FontPickerClient::endpoint() const
{
    return parts_->listener.endpoint();
}

ClientResult<bool> FontPickerClient::waitForFonts(const Activate& activate,
                                                  std::optional<std::chrono::milliseconds> timeout)
{
    const auto deadline = deadlineAfter(timeout);
    for (;;) {
        bool hasFonts = false;
        parts_->listener.process(
            [&](const PeerCall& call) { hasFonts = parts_->handle(call, activate) || hasFonts; });
        if (hasFonts) {
            return true;
        }
        auto waited = waitFor(parts_->listener.descriptors(), deadline);
        if (!waited || !*waited) {
            return waited;
        }
    }
}

ClientResult<FileDescriptor> FontPickerClient::openFont(const std::string& path)
{
    return parts_->opener.open(fontGrantFor(parts_->latest, path), path);
}

}  // namespace typhon
