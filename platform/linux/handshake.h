#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace typhon {

/// One side of the exchange of lines that comes before the D-Bus messages: bytes in, bytes out, and no
/// socket. What the other side may send is bounded in bytes and lines. The caller locks.
class Handshake {
public:
    enum class State { going, done, failed };

    virtual ~Handshake() = default;

    /// Takes what has arrived, but nothing behind the end of the handshake (or behind what made it fail):
    /// gives the number of bytes taken.
    std::size_t receive(std::string_view bytes);
    /// What is to be sent to the other side now.
    std::string takeOutput();
    State state() const { return state_; }
    /// Why it has failed.
    const std::string& problem() const { return problem_; }
    /// Both sides take descriptors.
    bool descriptorsAgreed() const { return descriptorsAgreed_; }

    /// What the other side may send in all.
    static constexpr std::size_t maximumBytes = 16U << 10;
    static constexpr unsigned maximumLines = 64;

protected:
    explicit Handshake(bool startsWithZero) : zeroExpected_(startsWithZero) {}

    /// A line without its end.
    virtual void receiveLine(std::string_view line) = 0;
    void send(std::string_view text) { output_ += text; }
    void agreeOnDescriptors() { descriptorsAgreed_ = true; }
    void finish() { state_ = State::done; }
    void fail(std::string problem);

private:
    void receiveByte(char byte);

    State state_ = State::going;
    bool zeroExpected_;
    bool descriptorsAgreed_ = false;
    std::size_t bytes_ = 0;
    unsigned lines_ = 0;
    std::string line_;
    std::string output_;
    std::string problem_;
};

/// The server's side. EXTERNAL and ANONYMOUS are welcome alike, and who the client claims to be is of no
/// interest (it may be user 0 of a user namespace): decisions are made by what the kernel says of the socket.
class ServerHandshake : public Handshake {
public:
    /// `identifier` is the server's, 32 hexadecimal digits.
    explicit ServerHandshake(std::string identifier) : Handshake(true), identifier_(std::move(identifier)) {}

private:
    enum class Waiting { forMechanism, forExternalData, forAnonymousData, forBegin };

    void receiveLine(std::string_view line) override;
    void receiveInAuthentication(std::string_view command, std::string_view rest);
    void receiveAuthenticated(std::string_view command);
    void receiveMechanism(std::string_view mechanism, const std::string* response);
    void receiveResponse(Waiting kind, std::string_view response);
    void reject();

    const std::string identifier_;
    Waiting waiting_ = Waiting::forMechanism;
};

/// The client's side. It says all it has to say at once.
class ClientHandshake : public Handshake {
public:
    ClientHandshake();

private:
    void receiveLine(std::string_view line) override;

    bool authenticated_ = false;
};

}  // namespace typhon
