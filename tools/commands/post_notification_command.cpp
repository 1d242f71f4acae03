#include "tools/commands/command.h"
#include "tools/notification_post.h"
#include "tools/property_list_file.h"
#include "tools/property_list_json.h"

namespace typhon {

namespace {

struct Options {
    std::string name;
    std::optional<std::string> userInfo;
};

/// JSON begins like an object; everything else names a file.
ClientResult<PropertyList> userInfoFrom(const std::string& text)
{
    const auto start = text.find_first_not_of(" \t\n");
    if (start == std::string::npos || text[start] != '{') {
        return readPropertyListFile(text);
    }
    if (auto value = propertyListFromJson(text)) {
        return std::move(*value);
    }
    return ClientError{{}, "the user info is not sound JSON", "Quote it: --user-info '{\"key\": \"value\"}'"};
}

int post(const Invocation& invocation, const Options& options)
{
    std::optional<PropertyList> userInfo;
    if (options.userInfo) {
        auto value = userInfoFrom(*options.userInfo);
        if (!value) {
            fail(value.error().message, value.error().advice);
            return exitUsage;
        }
        if (value->asDictionary() == nullptr) {
            fail("the user info is no dictionary", "Give a JSON object, or a property list that holds one.");
            return exitUsage;
        }
        userInfo = std::move(*value);
    }
    const auto posted = postNotification(invocation.root(), options.name, userInfo);
    return posted ? exitSuccess : fail(posted.error().message, posted.error().advice);
}

void declare(CLI::App& command, Options& options)
{
    command.add_option("name", options.name, "The notification's name")->required()->type_name("NAME");
    command
        .add_option("--user-info", options.userInfo,
                    "Post a distributed notification with this dictionary: a JSON object, or the file of a "
                    "property list (\"-\": standard input)")
        ->type_name("JSON|PLIST");
}

}  // namespace

void addPostNotificationCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "post-notification",
                        "Post a notification to the whole system (administrators only)", post, declare);
}

}  // namespace typhon
