#pragma once

#include "platform/linux/root_directory.h"

#include <string>

/// What a helper without a service manager leaves in /run/typhon for those who start and stop it.
namespace typhon::helper_files {

inline constexpr const char* runDirectory = "/run/typhon";
/// Its process identifier, as decimal text.
inline constexpr const char* processIdentifier = "/run/typhon/typhon-fontmanagerd.pid";
/// Its standard error.
inline constexpr const char* log = "/run/typhon/typhon-fontmanagerd.log";
/// Held while somebody starts it.
inline constexpr const char* startLock = "/run/typhon/typhon-fontmanagerd.start";
/// The program's file name.
inline constexpr const char* program = "typhon-fontmanagerd";

}  // namespace typhon::helper_files
