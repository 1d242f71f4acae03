// Any bytes as either side of the handshake, in pieces of any sizes: how they are cut makes no difference,
// and what comes behind the end stays untouched.

#include "platform/linux/handshake.h"
#include "require.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace typhon {
namespace {

using State = Handshake::State;

struct Outcome {
    State state;
    std::size_t taken;
    std::string output;
    bool descriptors;
    bool operator==(const Outcome&) const = default;
};

/// The bytes in pieces, whose sizes `cuts` gives in turn; without any, all at once.
Outcome play(Handshake& handshake, std::string_view bytes, std::string_view cuts)
{
    Outcome outcome{State::going, 0, handshake.takeOutput(), false};
    for (std::size_t turn = 0; outcome.taken < bytes.size() && handshake.state() == State::going; ++turn) {
        const auto size =
            cuts.empty() ? bytes.size() : 1 + static_cast<unsigned char>(cuts[turn % cuts.size()]) % 32u;
        const auto piece = bytes.substr(outcome.taken, size);
        const auto taken = handshake.receive(piece);
        require(taken <= piece.size(), "no more is taken than there is");
        require(taken == piece.size() || handshake.state() != State::going, "all is taken until the end");
        outcome.taken += taken;
        outcome.output += handshake.takeOutput();
    }
    outcome.state = handshake.state();
    outcome.descriptors = handshake.descriptorsAgreed();
    return outcome;
}

template <class Side, class... Arguments>
Outcome checkSide(std::string_view bytes, std::string_view cuts, Arguments... arguments)
{
    Side whole(arguments...);
    Side cut(arguments...);
    const auto outcome = play(whole, bytes, {});
    require(outcome == play(cut, bytes, cuts), "how the bytes are cut makes no difference");
    require(outcome.taken <= Handshake::maximumBytes + 2, "the handshake is bounded");
    require(outcome.output.size() <= 100 * (Handshake::maximumLines + 1), "and so is its answer");
    require(outcome.state != State::going || outcome.taken == bytes.size(),
            "it waits for more only at the end");
    return outcome;
}

void check(std::string_view input)
{
    const auto cuts = input.substr(0, std::min<std::size_t>(4, input.size()));
    const auto bytes = input.substr(cuts.size());
    const auto server = checkSide<ServerHandshake>(bytes, cuts, std::string(32, 'a'));
    if (server.state == State::done) {
        require(bytes.substr(0, server.taken).ends_with("\r\n"), "it ends with its last line");
        require(server.output.find("OK ") != std::string::npos, "and not without authentication");
    }
    checkSide<ClientHandshake>(bytes, cuts);
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({reinterpret_cast<const char*>(data), size});
    return 0;
}
