#include "tools/agent/raw_terminal.h"

#include <csignal>
#include <string_view>

#include <sys/ioctl.h>
#include <unistd.h>

// The terminal's other screen is used, so that the user finds this one as it was. A fault (SIGSEGV and the
// like) gives the terminal back with nothing but calls that a signal handler may make.

namespace typhon {

namespace {

constexpr std::string_view enter = "\x1B[?1049h\x1B[?25l";
constexpr std::string_view leave = "\x1B[0m\x1B[?25h\x1B[?1049l";

volatile std::sig_atomic_t takenDescriptor = -1;
termios givenBack;

void writeAll(int descriptor, std::string_view text)
{
    while (!text.empty()) {
        const auto count = ::write(descriptor, text.data(), text.size());
        if (count <= 0) {
            return;
        }
        text.remove_prefix(static_cast<std::size_t>(count));
    }
}

void giveBack(int descriptor, const termios& before)
{
    writeAll(descriptor, leave);
    ::tcsetattr(descriptor, TCSADRAIN, &before);
}

void giveBackAndDie(int signal)
{
    if (takenDescriptor >= 0) {
        giveBack(takenDescriptor, givenBack);
    }
    // Back to the usual action, which was set at the delivery.
    ::raise(signal);
}

void guardAgainstFaults()
{
    struct sigaction action {};
    action.sa_handler = giveBackAndDie;
    action.sa_flags = static_cast<int>(SA_RESETHAND | SA_NODEFER);
    for (const int signal : {SIGSEGV, SIGABRT, SIGBUS, SIGFPE, SIGILL}) {
        ::sigaction(signal, &action, nullptr);
    }
}

}  // namespace

RawTerminal::RawTerminal(int descriptor) : descriptor_(descriptor)
{
    ::tcgetattr(descriptor_, &before_);
    givenBack = before_;
    guardAgainstFaults();
    takenDescriptor = descriptor_;
    retake();
}

RawTerminal::~RawTerminal()
{
    takenDescriptor = -1;
    giveBack(descriptor_, before_);
}

void RawTerminal::retake()
{
    termios raw = before_;
    ::cfmakeraw(&raw);
    // Lines still begin at the left.
    raw.c_oflag |= OPOST | ONLCR;
    ::tcsetattr(descriptor_, TCSADRAIN, &raw);
    writeAll(descriptor_, enter);
}

void RawTerminal::show(const std::vector<std::string>& lines) const
{
    std::string text = "\x1B[H\x1B[2J";
    const char* separator = "";
    for (const auto& line : lines) {
        text += separator + line;
        separator = "\n";
    }
    writeAll(descriptor_, text);
}

TerminalSize RawTerminal::size() const
{
    winsize window{};
    if (::ioctl(descriptor_, TIOCGWINSZ, &window) != 0 || window.ws_col == 0 || window.ws_row == 0) {
        return {};
    }
    return {window.ws_col, window.ws_row};
}

bool RawTerminal::isForeground(int descriptor)
{
    return ::tcgetpgrp(descriptor) == ::getpgrp();
}

}  // namespace typhon
