#include "tools/commands/font_changes.h"

#include "fontmanager/font_paths.h"
#include "fontmanager/font_registry_client.h"
#include "fontmanager/profile_fonts.h"
#include "platform/file_url.h"
#include "tools/font_table.h"
#include "tools/property_list_json.h"

#include <cstdio>
#include <filesystem>

#include <fmt/format.h>
#include <unistd.h>

namespace typhon {

namespace {

struct InstallOptions {
    std::string identifier;
    bool isDisabled = false;
    std::vector<std::string> files;
};

struct ChangeOptions {
    std::string identifier;
    bool all = false;
    std::vector<std::string> fonts;
};

ClientResult<FontRegistryClient> connect(const Invocation& invocation)
{
    const auto root = invocation.root();
    return FontRegistryClient::connect(
        {.root = root.isScratch() ? root.directory() : std::string("/"), .helper = std::nullopt});
}

/// Counts on the terminal of whoever waits for a long installation.
void showProgress(std::size_t taken, std::size_t all)
{
    constexpr std::size_t fewEnough = 10;
    if (all <= fewEnough || ::isatty(STDERR_FILENO) == 0) {
        return;
    }
    fmt::print(stderr, "\r{} of {} font files{}", taken, all, taken == all ? "\n" : "");
    std::fflush(stderr);
}

/// The registered entries of these paths; entries without names where this program may not read the registry.
PropertyList entriesOf(const Invocation& invocation, const std::vector<std::string>& paths, bool enabled)
{
    const auto registry = readFontRecord(invocation.root(), font_paths::registry);
    PropertyList::Dictionary entries;
    for (const auto& path : paths) {
        const auto* entry = registry.find(path);
        entries.emplace(path, entry == nullptr ? PropertyList::Dictionary{{"disabled", !enabled}} : *entry);
    }
    return entries;
}

int install(const Invocation& invocation, const InstallOptions& options)
{
    auto client = connect(invocation);
    if (!client) {
        return fail(client.error());
    }
    const auto paths =
        client->registerFonts(options.identifier, options.files, !options.isDisabled, showProgress);
    if (!paths) {
        return fail(paths.error());
    }
    const auto entries = entriesOf(invocation, *paths, !options.isDisabled);
    return invocation.json ? printJson(jsonOf(entries)) : print(registryText(entries));
}

/// The file URL of a font that was named by its URL, its path or, with an identifier, its file name.
std::optional<std::string> urlOf(const Invocation& invocation, const std::string& font,
                                 const std::string& identifier)
{
    if (font.starts_with("file:")) {
        return font;
    }
    if (font.find('/') == std::string::npos) {
        const auto directory = font_paths::fontDirectoryOfProvider(identifier);
        return directory ? std::optional(fileUrlFromPath(*directory + "/" + font)) : std::nullopt;
    }
    auto path = std::filesystem::absolute(font).lexically_normal().string();
    const auto root = invocation.root().directory();
    if (!root.empty() && path.starts_with(root + "/")) {
        path.erase(0, root.size());
    }
    return fileUrlFromPath(path);
}

ClientResult<std::vector<std::string>> urlsOf(const Invocation& invocation, const ChangeOptions& options)
{
    std::vector<std::string> urls;
    for (const auto& font : options.fonts) {
        auto url = urlOf(invocation, font, options.identifier);
        if (!url) {
            return ClientError{ipc_errors::invalidArguments, "whose font is " + font + "?",
                               "Give its path as \"typhonctl fonts list\" shows it, or --identifier ID."};
        }
        urls.push_back(std::move(*url));
    }
    return urls;
}

int answer(const Invocation& invocation, const ClientResult<std::int64_t>& changed, const char* what)
{
    if (!changed) {
        return fail(changed.error());
    }
    return invocation.json
               ? printJson({{"changed", *changed}})
               : print(fmt::format("{} font file{} {}\n", *changed, *changed == 1 ? "" : "s", what));
}

int remove(const Invocation& invocation, const ChangeOptions& options)
{
    if (options.all == !options.fonts.empty()) {
        fail("remove takes fonts, or --all of a provider's", "See typhonctl fonts remove --help.");
        return exitUsage;
    }
    auto client = connect(invocation);
    if (!client) {
        return fail(client.error());
    }
    if (options.all) {
        return answer(invocation, client->unregisterAllFonts(options.identifier), "removed");
    }
    const auto urls = urlsOf(invocation, options);
    return urls ? answer(invocation, client->unregisterFonts(*urls), "removed") : fail(urls.error());
}

int enableOrDisable(const Invocation& invocation, const ChangeOptions& options, bool enabled)
{
    const auto urls = urlsOf(invocation, options);
    if (!urls) {
        return fail(urls.error());
    }
    auto client = connect(invocation);
    if (!client) {
        return fail(client.error());
    }
    return answer(invocation, client->enableOrDisable(*urls, enabled),
                  enabled ? "switched on" : "switched off");
}

void declareIdentifier(CLI::App& command, std::string& identifier)
{
    command.add_option("--identifier", identifier, "Whose fonts (default: this program's own identifier)")
        ->type_name("ID");
}

void declareFonts(CLI::App& command, ChangeOptions& options)
{
    declareIdentifier(command, options.identifier);
    command
        .add_option("font", options.fonts,
                    "Fonts: paths as \"fonts list\" shows them, file URLs, or file names of --identifier")
        ->type_name("FONT...");
}

}  // namespace

void addFontChangeCommands(CLI::App& fonts, Invocation& invocation)
{
    addCommand<InstallOptions>(
        fonts, invocation, "install", "Install font files for a provider, all or none of them", install,
        [](CLI::App& command, InstallOptions& options) {
            declareIdentifier(command, options.identifier);
            command.add_flag("--disabled", options.isDisabled, "Leave them switched off");
            command.add_option("file", options.files, "Font files: .ttf, .otf, .ttc or .otc")
                ->required()
                ->type_name("FILE...");
        });
    addCommand<ChangeOptions>(fonts, invocation, "remove", "Remove fonts and their files", remove,
                              [](CLI::App& command, ChangeOptions& options) {
                                  declareFonts(command, options);
                                  command.add_flag("--all", options.all, "All fonts of the provider");
                              });
    for (const bool enabled : {true, false}) {
        addCommand<ChangeOptions>(
            fonts, invocation, enabled ? "enable" : "disable",
            enabled ? "Switch fonts on" : "Switch fonts off, but keep them",
            [enabled](const Invocation& given, const ChangeOptions& options) {
                return enableOrDisable(given, options, enabled);
            },
            [](CLI::App& command, ChangeOptions& options) {
                declareFonts(command, options);
                command.get_option("font")->required();
            });
    }
}

}  // namespace typhon
