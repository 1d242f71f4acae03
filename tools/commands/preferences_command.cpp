#include "platform/linux/linux_preferences.h"
#include "tools/commands/command.h"
#include "tools/complaints.h"
#include "tools/property_list_json.h"
#include "tools/property_list_text.h"
#include "tools/typed_value.h"

#include <iterator>
#include <vector>

namespace typhon {

namespace {

constexpr const char* advice = "Only an administrator may use the daemon's preferences; use sudo.";

struct GetOptions {
    std::string key;
};

struct SetOptions {
    std::string key;
    std::optional<std::string> value;
    std::string type;
    bool remove = false;
};

int get(const Invocation& invocation, const GetOptions& options)
{
    Complaints complaints;
    LinuxPreferences preferences(invocation.root(), complaints);
    const auto found = options.key.empty() ? std::optional(PropertyList(preferences.values()))
                                           : preferences.value(options.key);
    if (const auto complaint = complaints.text(); !complaint.empty()) {
        return fail(complaint, advice);
    }
    if (!found) {
        return fail("there is no preference \"" + options.key + "\"",
                    "See which there are: typhonctl preferences get");
    }
    return invocation.json ? printJson(jsonOf(*found)) : print(propertyListText(*found));
}

int store(const Invocation& invocation, const std::string& key, std::optional<PropertyList> value)
{
    Complaints complaints;
    LinuxPreferences preferences(invocation.root(), complaints);
    preferences.setValue(key, std::move(value));
    return preferences.synchronize() ? exitSuccess : fail(complaints.text(), advice);
}

int set(const Invocation& invocation, const SetOptions& options)
{
    if (options.remove != !options.value.has_value()) {
        fail("preferences set needs either a value or --remove", "typhonctl preferences set KEY VALUE");
        return exitUsage;
    }
    if (options.remove) {
        return store(invocation, options.key, std::nullopt);
    }
    auto value = typedValue(*options.value, options.type);
    if (!value) {
        fail("\"" + *options.value + "\" is not " +
                 (options.type.empty() ? "sound JSON" : "of the type " + options.type),
             "Give JSON, or the type with --type; for text that looks like JSON: --type string");
        return exitUsage;
    }
    return store(invocation, options.key, std::move(value));
}

void declareGet(CLI::App& command, GetOptions& options)
{
    command.add_option("key", options.key, "The preference (default: all)")->type_name("KEY");
}

void declareSet(CLI::App& command, SetOptions& options)
{
    command.add_option("key", options.key, "The preference")->required()->type_name("KEY");
    command.add_option("value", options.value, "JSON; anything else is text unless --type says otherwise")
        ->type_name("VALUE");
    command.add_option("--type", options.type, "Read VALUE as this type; data is base64, a date is in UTC")
        ->check(CLI::IsMember(std::vector<std::string>(std::begin(valueTypes), std::end(valueTypes))));
    command.add_flag("--remove", options.remove, "Remove the preference");
}

}  // namespace

void addPreferencesCommand(CLI::App& parser, Invocation& invocation)
{
    CLI::App& command = *parser.add_subcommand(
        "preferences", "Show or change the daemon's preferences; other keys stay as they are");
    command.require_subcommand(1)->fallthrough();
    addCommand<GetOptions>(command, invocation, "get", "Show one preference or all", get, declareGet);
    addCommand<SetOptions>(command, invocation, "set", "Change one preference", set, declareSet);
}

}  // namespace typhon
