#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace typhon {

enum class Key { up, down, left, right, enter, escape, interrupt };

/// Makes keys of the bytes that a terminal sends. A lone escape byte may be the beginning of a sequence: it
/// is a key of its own once `flush` says that nothing follows. Bytes that mean nothing are dropped.
class TerminalKeys {
public:
    std::vector<Key> read(std::string_view bytes);
    std::vector<Key> flush();
    /// Whether a sequence has begun.
    bool isWaiting() const { return !pending_.empty(); }

private:
    std::string pending_;
};

}  // namespace typhon
