#include "sdk/web_content_process.h"

#include "platform/linux/listening_sockets.h"
#include "sdk/client_errors.h"
#include "sdk/font_grant.h"
#include "sdk/font_opener.h"
#include "sdk/service_connection.h"
#include "sdk/service_socket.h"
#include "sdk/waiting.h"

#include <cerrno>
#include <list>
#include <utility>

#include <sys/socket.h>

namespace typhon {

namespace {

/// Whoever holds the endpoint may connect; more than these wait.
constexpr std::size_t mostConnections = 16;

FileDescriptor acceptFrom(const FileDescriptor& listening)
{
    return FileDescriptor(::accept4(listening.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
}

}  // namespace

struct WebContentProcess::Parts {
    Parts(ListeningSocket listeningSocket, RootDirectory root)
        : socket(std::move(listeningSocket)), opener(std::move(root))
    {}

    void accept();
    void handle(const PeerCall& call);
    void processAll();
    std::vector<pollfd> descriptors() const;

    ListeningSocket socket;
    FontOpener opener;
    /// From the daemon; whoever else holds the endpoint may have one as well.
    std::list<ServiceConnection> connections;
    std::optional<Fonts> received;
    PropertyList latest;
};

void WebContentProcess::Parts::accept()
{
    while (connections.size() < mostConnections) {
        auto accepted = acceptFrom(socket.socket);
        if (!accepted) {
            return;
        }
        auto connection = ServiceConnection::overSocket(std::move(accepted), "the daemon");
        if (connection) {
            connection->setCallHandler([this](const PeerCall& call) { handle(call); });
            connections.push_back(std::move(*connection));
        }
    }
}

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
    accept();
    connections.remove_if([](ServiceConnection& connection) { return !connection.process(); });
}

std::vector<pollfd> WebContentProcess::Parts::descriptors() const
{
    std::vector<pollfd> all;
    if (connections.size() < mostConnections) {
        all.push_back({socket.socket.get(), POLLIN, 0});
    }
    for (const auto& connection : connections) {
        all.push_back({connection.descriptor(), connection.events(), 0});
    }
    return all;
}

ClientResult<WebContentProcess> WebContentProcess::listen(const Options& options)
{
    auto root = chosenRoot(options.root);
    auto socket = listenAnonymously(root);
    if (!socket.socket) {
        return clientError(ipc_errors::failed, "cannot make an endpoint: " + socket.problem);
    }
    return WebContentProcess(std::make_unique<Parts>(std::move(socket), std::move(root)));
}

WebContentProcess::WebContentProcess(std::unique_ptr<Parts> parts) : parts_(std::move(parts)) {}
WebContentProcess::WebContentProcess(WebContentProcess&&) noexcept = default;
WebContentProcess& WebContentProcess::operator=(WebContentProcess&&) noexcept = default;
WebContentProcess::~WebContentProcess() = default;

const FileDescriptor& WebContentProcess::endpoint() const
{
    return parts_->socket.endpoint;
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
        const auto waited = waitFor(parts_->descriptors(), deadline);
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
