#pragma once

#include "platform/linux/file_descriptor.h"

namespace typhon {

/// A private read-only mount of a directory (an `O_PATH` descriptor will do), with what is mounted below it.
/// Nobody can make it writable again: not even the owner of another user namespace who gets hold of a file
/// that was opened through it. None where the system does not let processes make user namespaces.
FileDescriptor lockedReadOnlyMount(int directory);

}  // namespace typhon
