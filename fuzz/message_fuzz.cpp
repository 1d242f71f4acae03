// Any bytes as what a peer sends after the handshake, with descriptors: once all there at once, so that
// sd-bus reads them from the socket, and once in pieces, which are put together. Both must come to the same
// end, and the arguments are read with the types that the message claims.

#include "platform/linux/bus_message.h"
#include "platform/linux/bus_message_codec.h"
#include "platform/linux/descriptor_passing.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/message_bytes.h"
#include "platform/linux/message_decoder.h"
#include "platform/linux/message_reception.h"
#include "platform/linux/opened_bus.h"
#include "platform/linux/property_list_writer.h"
#include "require.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

namespace typhon {
namespace {

using Outcome = MessageReception::Outcome;

constexpr std::size_t largestMessage = 64U << 10;

MessageLimits limits()
{
    MessageLimits result;
    result.values = 4096;
    result.depth = 16;
    result.bytes = largestMessage;
    result.descriptors = 2;
    result.memoryFileBytes = 64U << 10;
    return result;
}

bool sendPiece(int socket, std::string_view bytes, unsigned descriptors)
{
    static const auto file =
        sealedMemoryFile(writeBinaryPropertyList(PropertyList(PropertyList::Dictionary{{"key", "value"}})));
    const std::span data(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
    const std::vector<int> copies(descriptors, file.get());
    return sendWithDescriptors(socket, data, copies, MSG_DONTWAIT) == static_cast<ssize_t>(bytes.size());
}

/// What became of the messages: the number of those that were understood, how it ended, and their arguments.
struct Reception {
    std::vector<std::string> messages;
    bool refused = false;
    bool operator==(const Reception&) const = default;
};

std::string describe(sd_bus_message* message)
{
    const char* member = sd_bus_message_get_member(message);
    const char* signature = sd_bus_message_get_signature(message, 1);
    require(signature != nullptr, "a message has a signature");
    const auto reading = readMessage(message, signature, AuditToken{}, limits());
    require(reading.memory <= 4 * limits().memoryFileBytes + 96 * limits().values + limits().bytes,
            "the memory of arguments is bounded");
    return std::string(member == nullptr ? "" : member) + " " + signature +
           (reading.arguments ? " read" : "");
}

class Peer {
public:
    Peer()
    {
        require(bus_.open(true) >= 0, "a bus opens");
        int pair[2];
        require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, pair) == 0, "sockets");
        far_ = FileDescriptor(pair[0]);
        require(bus_.moveOnto(FileDescriptor(pair[1])) >= 0, "and moves");
        require(sd_bus_add_filter(bus_.get(), nullptr, keep, this) >= 0, "and is listened to");
    }

    int farEnd() const { return far_.get(); }
    Reception result;

    /// Reads until there is nothing more.
    void read()
    {
        while (!result.refused && readOne()) {
        }
    }

private:
    MessageReception::Source source() const
    {
        static const auto held = std::make_shared<HeldBytes>(1U << 20, 1U << 20);
        static const AuditToken peer;
        return {bus_.socket(), largestMessage, 3, {held, peer}};
    }
    static int keep(sd_bus_message* message, void* peer, sd_bus_error*)
    {
        static_cast<Peer*>(peer)->last_.reset(sd_bus_message_ref(message));
        return 0;
    }
    std::size_t waiting() const
    {
        int bytes = 0;
        require(::ioctl(bus_.socket(), SIOCINQ, &bytes) == 0, "the socket tells what it holds");
        return static_cast<std::size_t>(bytes);
    }
    /// Of the plain message that waits.
    std::size_t nextSize() const
    {
        std::array<std::uint8_t, messageHeaderSize> header{};
        require(::recv(bus_.socket(), header.data(), header.size(), MSG_PEEK) == messageHeaderSize,
                "a message waits");
        return header.size() + (numberIn(header, 12) + 7) / 8 * 8 + numberIn(header, 4);
    }
    bool readReady()
    {
        const auto expected = waiting() - nextSize();
        sd_bus_message* raw = nullptr;
        const int got = bus_.readMessage(&raw);
        const BusMessage message(raw);
        require(got > 0 && last_ != nullptr, "sd-bus understands what is plain");
        require(waiting() == expected, "and reads nothing behind it");
        result.messages.push_back(describe(last_.get()));
        last_.reset();
        return true;
    }
    bool readOne()
    {
        switch (reception_.next(source())) {
        case Outcome::ready:
        case Outcome::readyAmongOthers:
            return readReady();
        case Outcome::assembled: {
            MessageDecoder decoder;
            auto* message = decoder.decode(reception_.take());
            result.refused = message == nullptr;
            if (message != nullptr) {
                result.messages.push_back(describe(message));
            }
            return true;
        }
        case Outcome::nothing:
        case Outcome::begun:
            return false;
        default:
            result.refused = true;
            return true;
        }
    }

    OpenedBus bus_;
    FileDescriptor far_;
    MessageReception reception_;
    BusMessage last_;
};

void check(std::string_view input)
{
    if (input.size() < 2 || input.size() > largestMessage) {
        return;
    }
    const auto descriptors = static_cast<unsigned char>(input[0]) % 4u;
    const auto piece = 1U + static_cast<unsigned char>(input[1]);
    const auto bytes = input.substr(2);
    Peer whole;
    Peer cut;
    if (bytes.empty() || !sendPiece(whole.farEnd(), bytes, descriptors)) {
        return;
    }
    whole.read();
    for (std::size_t at = 0; at < bytes.size() && !cut.result.refused; at += piece) {
        if (!sendPiece(cut.farEnd(), bytes.substr(at, piece), at == 0 ? descriptors : 0)) {
            return;
        }
        cut.read();
    }
    require(whole.result == cut.result, "how the bytes are cut makes no difference");
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({reinterpret_cast<const char*>(data), size});
    return 0;
}
