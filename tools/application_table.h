#pragma once

#include "platform/linux/linux_application_registry.h"

#include <string>
#include <vector>

#include <nlohmann/json.hpp>

namespace typhon {

/// What the application registry knows, as a table for people.
std::string applicationsText(const std::vector<LinuxApplicationRegistry::Known>& applications);

/// The same by bundle identifier: "version" (if known), "placeholder" and "directory".
nlohmann::json applicationsJson(const std::vector<LinuxApplicationRegistry::Known>& applications);

}  // namespace typhon
