#pragma once

#include "platform/property_list.h"
#include "sdk/client_result.h"

#include <string>

namespace typhon {

/// The property list in a file (XML or binary) at a real path; "-" is standard input.
ClientResult<PropertyList> readPropertyListFile(const std::string& path);

}  // namespace typhon
