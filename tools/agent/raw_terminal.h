#pragma once

#include "tools/agent/dialog_picture.h"

#include <string>
#include <vector>

#include <termios.h>

namespace typhon {

/// The terminal at a descriptor while the dialog is on it: keys come one by one and unechoed, and the dialog
/// has a screen of its own. The end of this object, and a signal that kills the process for a fault, give the
/// terminal back as it was. One at a time.
class RawTerminal {
public:
    /// `descriptor` outlives this.
    explicit RawTerminal(int descriptor);
    ~RawTerminal();
    RawTerminal(const RawTerminal&) = delete;
    RawTerminal& operator=(const RawTerminal&) = delete;

    /// Takes the terminal again after the process was stopped and goes on.
    void retake();
    void show(const std::vector<std::string>& lines) const;
    TerminalSize size() const;

    /// Whether this process's group may use the terminal now.
    static bool isForeground(int descriptor);

private:
    const int descriptor_;
    termios before_{};
};

}  // namespace typhon
