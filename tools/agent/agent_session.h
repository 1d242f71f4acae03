#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "platform/property_list.h"
#include "sdk/client_result.h"
#include "sdk/service_connection.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>

namespace typhon {

/// An alert that the daemon has asked for.
struct ReceivedAlert {
    PropertyList userInfo;
    FileDescriptor endpoint;
    /// Tells the daemon that the alert has ended.
    std::function<void()> ended;
};

/// A session agent's side of its service: registers, reports terminals and receives alerts. One thread.
class AgentSession {
public:
    /// Connects and registers.
    static ClientResult<AgentSession> open(const RootDirectory& root);

    AgentSession(AgentSession&&) = default;
    AgentSession& operator=(AgentSession&&) = default;

    /// Reports the terminals of the user's login sessions, as far as they have changed.
    ClientResult<Done> reportTerminals();
    /// Handles what has arrived.
    ClientResult<Done> process() { return connection_.process(); }
    int descriptor() const { return connection_.descriptor(); }
    short events() const { return connection_.events(); }

    /// The oldest alert that was not taken yet.
    std::optional<ReceivedAlert> takeAlert();

private:
    explicit AgentSession(ServiceConnection connection);

    ServiceConnection connection_;
    /// Filled by the connection's call handler; stays where it is when this object moves.
    std::unique_ptr<std::deque<ReceivedAlert>> alerts_;
    std::set<std::uint32_t> reported_;
};

/// Gives an answer to whoever asked for the alert, through its endpoint.
ClientResult<Done> answerAlert(const ReceivedAlert& alert, const PropertyList::Array& answers);

}  // namespace typhon
