#pragma once

namespace typhon::simulation {

/// What holds in every run, whatever happens on the device. A violation is reported under its name, and for
/// each of them there is a broken variant of the daemon that must be caught.
struct Invariant {
    const char* name;
    const char* sentence;
};

namespace invariants {

inline constexpr Invariant share{
    "share",
    "No client ever receives a path outside its grants, nor anything else that goes beyond its share."};
inline constexpr Invariant oneAnswer{
    "one answer", "No reply is sent twice, and every call comes to the one end that it is to come to."};
inline constexpr Invariant registered{
    "registered", "The ledger holds only paths that are registered at the moment of recording."};
inline constexpr Invariant flushed{
    "flushed", "What is set is flushed, and what was flushed is there after a restart, an administrator's "
               "changes included."};
inline constexpr Invariant nothingLeaks{
    "nothing leaks", "When every client is gone, no connection, observer or unfinished work is left of them, "
                     "and nothing holds a daemon that is let go of."};
inline constexpr Invariant oneAtATime{
    "one at a time", "One font request at a time passes the gate, none is lost there, and no two dialogs "
                     "are up at once."};

}  // namespace invariants

}  // namespace typhon::simulation
