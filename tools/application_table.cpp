#include "tools/application_table.h"

#include "tools/table.h"

namespace typhon {

std::string applicationsText(const std::vector<LinuxApplicationRegistry::Known>& applications)
{
    if (applications.empty()) {
        return "No applications are installed.";
    }
    Table table({"APPLICATION", "VERSION", "STATE", "DIRECTORY"});
    for (const auto& [record, directory] : applications) {
        table.addRow({record.bundleIdentifier, record.shortVersionString.value_or("-"),
                      record.isPlaceholder ? "placeholder" : "installed", directory});
    }
    return table.text();
}

nlohmann::json applicationsJson(const std::vector<LinuxApplicationRegistry::Known>& applications)
{
    auto json = nlohmann::json::object();
    for (const auto& [record, directory] : applications) {
        auto& entry = json[record.bundleIdentifier];
        if (record.shortVersionString) {
            entry["version"] = *record.shortVersionString;
        }
        entry["placeholder"] = record.isPlaceholder;
        entry["directory"] = directory;
    }
    return json;
}

}  // namespace typhon
