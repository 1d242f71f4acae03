#pragma once

#include "platform/linux/listening_sockets.h"
#include "sdk/client_result.h"
#include "sdk/service_connection.h"

#include <functional>
#include <list>
#include <vector>

#include <poll.h>

namespace typhon {

/// An endpoint of this process's own, for the daemon to connect to, and the connections made through it. The
/// process that makes it is the one that the daemon finds behind it. One thread at a time.
class EndpointListener {
public:
    using Handler = std::function<void(const PeerCall&)>;

    /// Makes the endpoint, in /run/typhon, the user's runtime directory, /tmp or /dev/shm.
    static ClientResult<EndpointListener> listen(const RootDirectory& root);

    /// To be passed on. Owned by this object.
    const FileDescriptor& endpoint() const { return socket_.endpoint; }

    /// Accepts whoever has come and has `handler` answer all that has arrived.
    void process(const Handler& handler);
    /// What to wait for before the next `process`.
    std::vector<pollfd> descriptors() const;

private:
    explicit EndpointListener(ListeningSocket socket) : socket_(std::move(socket)) {}
    void accept();

    ListeningSocket socket_;
    /// From the daemon; whoever else holds the endpoint may have one as well.
    std::list<ServiceConnection> connections_;
};

}  // namespace typhon
