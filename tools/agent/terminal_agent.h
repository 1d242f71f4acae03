#pragma once

#include "platform/linux/root_directory.h"
#include "tools/agent/agent_session.h"
#include "tools/agent/missing_fonts_choice.h"
#include "tools/agent/raw_terminal.h"
#include "tools/agent/terminal_keys.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>

namespace typhon {

/// How alerts are answered: by the user, or at once with the first provider of every row, or with none.
enum class AnswerMode { ask, first, none };

/// The session agent in a terminal: waits for alerts and shows them one after another. One thread; blocks the
/// signals that end it for as long as it lives.
class TerminalAgent {
public:
    TerminalAgent(RootDirectory root, AnswerMode mode);

    /// Serves until a signal, or Ctrl-C in the dialog, ends it; the exit code.
    int run();

private:
    using Clock = std::chrono::steady_clock;

    int serve();
    bool connect();
    void rescan();
    void handleSignal();
    void handleKeys();
    void handle(Key key);
    void showNext();
    void openDialog();
    void draw();
    void finish(const PropertyList::Array& answers);
    int waitingTime() const;
    void poll();

    const RootDirectory root_;
    const AnswerMode mode_;
    FileDescriptor signals_;
    FileDescriptor terminals_;
    std::optional<AgentSession> session_;
    std::optional<int> exitCode_;

    /// When to look for terminals next, and for how long to wait after that.
    Clock::time_point nextScan_ = Clock::now();
    std::chrono::milliseconds scanPause_{0};

    std::optional<ReceivedAlert> alert_;
    std::optional<MissingFontsChoice> choice_;
    std::unique_ptr<RawTerminal> screen_;
    TerminalKeys keys_;
};

}  // namespace typhon
