#pragma once

#include <sys/stat.h>

/// Asks `statx` for a mount's number that no other mount gets until the next boot (Linux 6.8 and later),
/// which the system's headers lack.
#ifndef STATX_MNT_ID_UNIQUE
#define STATX_MNT_ID_UNIQUE 0x00004000U
#endif
