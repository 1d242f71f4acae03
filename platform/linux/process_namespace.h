#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/inode.h"
#include "platform/linux/process_inspection.h"

#include <functional>
#include <optional>

namespace typhon {

/// A descriptor of the process namespace of a process, from its directory in /proc. While it is open no other
/// namespace gets its inode.
FileDescriptor openProcessNamespace(int processDirectory);

/// Calls `visit` with the namespace and then with each one around it that the daemon may see, innermost
/// first, until it returns true. False when it never did.
bool walkOutwards(FileDescriptor processNamespace, const std::function<bool(const Inode&)>& visit);

/// True for the first process of the process namespace it lives in, if that is not the daemon's.
bool isFirstOfItsNamespace(const ProcessInspection& process);

}  // namespace typhon
