#include "tools/agent/terminal_agent.h"

#include "platform/linux/visible_text.h"
#include "sdk/client_errors.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <iostream>
#include <tuple>

#include <poll.h>
#include <sys/inotify.h>
#include <sys/signalfd.h>
#include <unistd.h>

// One loop over the daemon's connection, the keyboard, signals and the directory of pseudo-terminals. A new
// terminal gets its session a moment after it appears, and consoles appear without notice: so the look at the
// sessions is repeated, soon after a change and ever more rarely later.

namespace typhon {

namespace {

using std::chrono::milliseconds;

constexpr milliseconds firstPause{20};
constexpr milliseconds longestPause{30'000};
constexpr milliseconds reconnectPause{1'000};
constexpr milliseconds escapePause{100};

FileDescriptor catchSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGWINCH, SIGCONT}) {
        sigaddset(&signals, signal);
    }
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    ::signal(SIGPIPE, SIG_IGN);
    return FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
}

FileDescriptor watchTerminals()
{
    FileDescriptor watch(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    if (watch) {
        ::inotify_add_watch(watch.get(), "/dev/pts", IN_CREATE | IN_DELETE);
    }
    return watch;
}

void drain(const FileDescriptor& descriptor)
{
    std::array<char, 4096> buffer;
    while (::read(descriptor.get(), buffer.data(), buffer.size()) > 0) {
    }
}

void complain(const ClientError& error)
{
    std::cerr << "typhon-agent: " << visibleText(error.message) << "\n";
    if (!error.advice.empty()) {
        std::cerr << "  " << error.advice << "\n";
    }
}

}  // namespace

TerminalAgent::TerminalAgent(RootDirectory root, AnswerMode mode)
    : root_(std::move(root)), mode_(mode), signals_(catchSignals()), terminals_(watchTerminals())
{}

int TerminalAgent::run()
{
    if (mode_ == AnswerMode::ask && ::isatty(STDIN_FILENO) != 1) {
        std::cerr << "typhon-agent: standard input is not a terminal\n  Start it in a terminal, or let it "
                     "answer by itself with --answer first or --answer none.\n";
        return 2;
    }
    if (!connect()) {
        return exitCode_.value_or(1);
    }
    return serve();
}

bool TerminalAgent::connect()
{
    auto opened = AgentSession::open(root_);
    if (!opened) {
        complain(opened.error());
        return false;
    }
    session_.emplace(std::move(*opened));
    rescan();
    std::cout << "typhon-agent: waiting for applications that ask for missing fonts" << std::endl;
    return true;
}

int TerminalAgent::serve()
{
    while (!exitCode_) {
        if (session_ && !session_->process()) {
            session_.reset();
            finish({});
            std::cout << "typhon-agent: typhond is gone; waiting for it" << std::endl;
        }
        if (Clock::now() >= nextScan_) {
            rescan();
        }
        showNext();
        if (!exitCode_) {
            poll();
        }
    }
    // Whoever leaves in an orderly way has declined; otherwise every later request would wait for the answer.
    finish({});
    return *exitCode_;
}

/// Also the time to look for a daemon that was gone.
void TerminalAgent::rescan()
{
    if (!session_) {
        auto opened = AgentSession::open(root_);
        nextScan_ = Clock::now() + reconnectPause;
        if (!opened) {
            return;
        }
        session_.emplace(std::move(*opened));
        std::cout << "typhon-agent: typhond is back" << std::endl;
        scanPause_ = milliseconds(0);
    }
    // A connection that has ended is noticed at the next turn of the loop.
    std::ignore = session_->reportTerminals();
    scanPause_ = std::clamp(scanPause_ * 2, firstPause, longestPause);
    nextScan_ = Clock::now() + scanPause_;
}

void TerminalAgent::showNext()
{
    if (!alert_ && session_) {
        alert_ = session_->takeAlert();
        choice_ = alert_ ? std::optional<MissingFontsChoice>(alert_->userInfo) : std::nullopt;
        if (alert_ && mode_ == AnswerMode::ask && !RawTerminal::isForeground(STDIN_FILENO)) {
            std::cout << "\a\ntyphon-agent: an application asks for fonts; bring this program to the "
                         "foreground (fg) to answer"
                      << std::endl;
        }
    }
    if (!alert_ || screen_) {
        return;
    }
    if (mode_ != AnswerMode::ask) {
        if (mode_ == AnswerMode::first) {
            choice_->chooseFirst();
        }
        finish(choice_->answer());
    } else if (RawTerminal::isForeground(STDIN_FILENO)) {
        openDialog();
    }
}

void TerminalAgent::openDialog()
{
    // What was typed before the dialog was to be seen is no answer to it.
    ::tcflush(STDIN_FILENO, TCIFLUSH);
    screen_ = std::make_unique<RawTerminal>(STDIN_FILENO);
    keys_ = TerminalKeys();
    std::cout << '\a' << std::flush;
    draw();
}

void TerminalAgent::draw()
{
    screen_->show(dialogPicture(*choice_, screen_->size()));
}

void TerminalAgent::finish(const PropertyList::Array& answers)
{
    screen_.reset();
    choice_.reset();
    if (!alert_) {
        return;
    }
    const auto alert = std::exchange(alert_, std::nullopt);
    if (!session_) {
        return;
    }
    const auto outcome = answerAlert(*alert, answers);
    alert->ended();
    if (!outcome) {
        complain(outcome.error());
    } else {
        std::cout << "typhon-agent: answered, " << answers.size() << " to switch on" << std::endl;
    }
}

void TerminalAgent::handle(Key key)
{
    switch (key) {
    case Key::up:
        return choice_->selectPrevious();
    case Key::down:
        return choice_->selectNext();
    case Key::left:
        return choice_->previousProvider();
    case Key::right:
        return choice_->nextProvider();
    case Key::enter:
        return finish(choice_->answer());
    case Key::escape:
        return finish({});
    case Key::interrupt:
        exitCode_ = 130;
        return;
    }
}

void TerminalAgent::handleKeys()
{
    std::array<char, 256> buffer;
    const auto count = ::read(STDIN_FILENO, buffer.data(), buffer.size());
    if (count <= 0) {
        exitCode_ = 1;
        return;
    }
    const auto pressed = keys_.read({buffer.data(), static_cast<std::size_t>(count)});
    for (const auto key : pressed) {
        if (screen_ && !exitCode_) {
            handle(key);
        }
    }
    if (screen_ && !exitCode_) {
        draw();
    }
}

void TerminalAgent::handleSignal()
{
    signalfd_siginfo signal{};
    while (::read(signals_.get(), &signal, sizeof signal) == sizeof signal) {
        const auto number = static_cast<int>(signal.ssi_signo);
        if (number != SIGWINCH && number != SIGCONT) {
            exitCode_ = 128 + number;
        } else if (screen_) {
            if (number == SIGCONT) {
                screen_->retake();
            }
            draw();
        }
    }
}

int TerminalAgent::waitingTime() const
{
    const auto left = std::chrono::ceil<milliseconds>(nextScan_ - Clock::now());
    const auto longest = screen_ && keys_.isWaiting() ? escapePause : longestPause;
    return static_cast<int>(std::clamp(left, milliseconds(0), longest).count());
}

void TerminalAgent::poll()
{
    std::array<pollfd, 4> waiting{
        pollfd{signals_.get(), POLLIN, 0}, pollfd{terminals_.get(), POLLIN, 0},
        pollfd{screen_ ? STDIN_FILENO : -1, POLLIN, 0},
        pollfd{session_ ? session_->descriptor() : -1, session_ ? session_->events() : short{0}, 0}};
    const int ready = ::poll(waiting.data(), waiting.size(), waitingTime());
    if (ready == 0 && screen_ && keys_.isWaiting()) {
        for (const auto key : keys_.flush()) {
            handle(key);
        }
    }
    if (waiting[0].revents != 0) {
        handleSignal();
    }
    if (waiting[1].revents != 0) {
        drain(terminals_);
        scanPause_ = milliseconds(0);
        nextScan_ = Clock::now();
    }
    if (waiting[2].revents != 0 && screen_) {
        handleKeys();
    }
}

}  // namespace typhon
