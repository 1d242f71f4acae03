#include "faces_in_file.h"
#include "fontmanager/font_registry_client.h"
#include "platform/linux/visible_text.h"
#include "sample.h"

#include <cstdlib>
#include <iostream>
#include <string_view>
#include <utility>
#include <vector>

#include <fcntl.h>

// A small application of typhon, built once for each identifier, so that each is an executable of its own and
// can be signed as such. It shows what an application gets to see, and uses nothing but libtyphon and,
// for a font provider, the font-registry library.

namespace typhon::sample {

namespace {

constexpr const char* usage = R"(A sample application of typhon.

  checkin           what it sees, one line a face, and which extensions it got
  read              open every font it sees through its grant and read its names from the descriptor
  try PATH          try to get at a file that was not granted, in every way it has; 0 when all are refused
  install FILE...   install fonts of its own, as a font provider does
  remove            remove all fonts of its own
  reset IDENTIFIER  ask the daemon to forget the fonts issued to an application
  monitor           say what it is told of each change of fonts, a line each, and read what came
  monitor COUNT     the same, and end after so many changes
  request [--family NAME]... [--postscript NAME]...
                    ask for fonts by name, and read those that it was given
  picked            make an endpoint, send it over standard input (a socket), and read what the font picker
                    hands to it
  content           start a web-content process of its own and pass its fonts on to it

The system is that of the folder $TYPHON_ROOT, else of this machine.
)";

bool isFontPicker()
{
    return identifier == "com.vorlan.Panekit.FontPicker";
}

}  // namespace

int complain(const ClientError& error)
{
    std::cerr << identifier << ": " << visibleText(error.message) << " (" << error.name << ")\n";
    if (!error.advice.empty()) {
        std::cerr << "  " << error.advice << "\n";
    }
    return 1;
}

ClientResult<View> checkIn(TyphonClient& client)
{
    return isFontPicker() ? client.checkinForFontPicker() : client.checkin();
}

PropertyList::Dictionary fontsIn(const PropertyList& view)
{
    const auto* fonts = view.find("fontsInfo");
    return fonts == nullptr || fonts->asDictionary() == nullptr ? PropertyList::Dictionary{}
                                                                : *fonts->asDictionary();
}

void printFont(const std::string& path, const PropertyList& entry)
{
    const char* token = entry.find("data") == nullptr ? "" : "  [own token]";
    const auto* names = entry.find("familyName");
    const auto* faces = names == nullptr ? nullptr : names->asDictionary();
    for (const auto& [postScriptName, family] : faces == nullptr ? PropertyList::Dictionary{} : *faces) {
        const auto* text = family.asString();
        std::cout << "  " << visibleText(text == nullptr ? "-" : *text) << " / "
                  << visibleText(postScriptName) << "  " << visibleText(path) << token << "\n";
    }
}

namespace {

void printExtensions(const PropertyList& view)
{
    std::cout << "  extensions:";
    const char* separator = " ";
    for (const char* key : {"extension", "extension.fontasset", "extension.provider"}) {
        if (view.find(key) != nullptr) {
            std::cout << std::exchange(separator, ", ") << key;
        }
    }
    std::cout << (*separator == ' ' ? " none\n" : "\n");
    if (view.find("hide-profilefonts") != nullptr) {
        std::cout << "  profile fonts are hidden from it\n";
    }
}

int showCheckin(TyphonClient& client)
{
    const auto view = checkIn(client);
    if (!view) {
        return complain(view.error());
    }
    if (!*view) {
        std::cout << identifier << " has no share in the fonts (the answer is null)\n";
        return 0;
    }
    const auto fonts = fontsIn(**view);
    std::cout << identifier << " sees " << fonts.size() << " font files\n";
    for (const auto& [path, entry] : fonts) {
        printFont(path, entry);
    }
    printExtensions(**view);
    return 0;
}

}  // namespace

bool readFont(TyphonClient& client, const std::string& path)
{
    const auto file = client.openFont(path);
    if (!file) {
        complain(file.error());
        return false;
    }
    const auto faces = facesInFile(file->get());
    for (const auto& face : faces) {
        std::cout << "  " << visibleText(face.familyName) << " / " << visibleText(face.postScriptName)
                  << "\n";
    }
    return !faces.empty();
}

namespace {

int readFonts(TyphonClient& client)
{
    const auto view = checkIn(client);
    if (!view) {
        return complain(view.error());
    }
    std::size_t read = 0;
    const auto fonts = fontsIn(view->value_or(PropertyList()));
    for (const auto& [path, entry] : fonts) {
        read += readFont(client, path) ? 1 : 0;
    }
    std::cout << identifier << " read " << read << " of " << fonts.size()
              << " font files, each from the descriptor it was given\n";
    return read == fonts.size() ? 0 : 1;
}

/// Every token of a check-in, with the name it goes by; the empty one first.
std::vector<std::pair<std::string, Data>> tokensIn(const PropertyList& view)
{
    std::vector<std::pair<std::string, Data>> tokens{{"no token", {}}};
    for (const char* key : {"extension", "extension.fontasset", "extension.provider"}) {
        const auto* token = view.find(key);
        if (token != nullptr && token->asData() != nullptr) {
            tokens.emplace_back(key, *token->asData());
        }
    }
    for (const auto& [path, entry] : fontsIn(view)) {
        const auto* token = entry.find("data");
        if (token != nullptr && token->asData() != nullptr) {
            tokens.emplace_back("the token of " + path, *token->asData());
        }
    }
    return tokens;
}

bool isRefusedToItself(const RootDirectory& root, const std::string& path)
{
    const FileDescriptor file(::open(root.real(path).c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    std::cout << "  opened by itself: " << (file ? "IT COULD" : "refused") << "\n";
    return !file;
}

bool isRefused(TyphonClient& client, const std::string& path, const std::string& name, const Data& token)
{
    const auto file = client.redeem(token, path);
    std::cout << "  with " << visibleText(name) << ": "
              << (file ? std::string("IT COULD")
                       : "refused, " + file.error().name + ": " + visibleText(file.error().message))
              << "\n";
    return !file;
}

int tryFile(TyphonClient& client, const std::string& path)
{
    const auto view = checkIn(client);
    if (!view) {
        return complain(view.error());
    }
    std::cout << identifier << " tries to get " << visibleText(path) << "\n";
    bool allRefused = isRefusedToItself(client.root(), path);
    for (const auto& [name, token] : tokensIn(view->value_or(PropertyList()))) {
        allRefused = isRefused(client, path, name, token) && allRefused;
    }
    return allRefused ? 0 : 1;
}

int reset(TyphonClient& client, const std::string& application)
{
    const auto outcome = client.resetIssuedFontsFor(application);
    if (!outcome) {
        return complain(outcome.error());
    }
    std::cout << identifier << " asked to forget what was issued to " << visibleText(application)
              << "; the daemon answered\n";
    return 0;
}

int installFonts(const std::vector<std::string>& files)
{
    auto registry = FontRegistryClient::connect();
    if (!registry) {
        return complain(registry.error());
    }
    const auto paths = registry->registerFonts("", files, true);
    if (!paths) {
        return complain(paths.error());
    }
    std::cout << identifier << " installed " << paths->size() << " font files\n";
    for (const auto& path : *paths) {
        std::cout << "  " << visibleText(path) << "\n";
    }
    return 0;
}

int removeFonts()
{
    auto registry = FontRegistryClient::connect();
    if (!registry) {
        return complain(registry.error());
    }
    const auto removed = registry->unregisterAllFonts("");
    if (!removed) {
        return complain(removed.error());
    }
    std::cout << identifier << " removed " << *removed << " font files\n";
    return 0;
}

int runCommand(const std::vector<std::string>& words)
{
    const auto is = [&](std::string_view command, std::size_t count) {
        return words.size() == count && words.front() == command;
    };
    if (is("--help", 1) || is("help", 1)) {
        std::cout << usage;
        return 0;
    }
    if (words.size() > 1 && words.front() == "install") {
        return installFonts({words.begin() + 1, words.end()});
    }
    if (is("picked", 1)) {
        return receivePicked();
    }
    if (is("remove", 1)) {
        return removeFonts();
    }
    if (!is("checkin", 1) && !is("read", 1) && !is("try", 2) && !is("reset", 2) && !is("monitor", 1) &&
        !is("monitor", 2) && !is("content", 1) && (words.empty() || words.front() != "request")) {
        std::cerr << usage;
        return 2;
    }
    auto client = TyphonClient::connect();
    if (!client) {
        return complain(client.error());
    }
    if (words.front() == "checkin") {
        return showCheckin(*client);
    }
    if (words.front() == "read") {
        return readFonts(*client);
    }
    if (words.front() == "monitor") {
        return monitor(*client, words.size() == 2 ? std::strtoul(words[1].c_str(), nullptr, 10) : 0);
    }
    if (words.front() == "request") {
        return requestFonts(*client, {words.begin() + 1, words.end()});
    }
    if (words.front() == "content") {
        return showContent(*client);
    }
    return words.front() == "try" ? tryFile(*client, words[1]) : reset(*client, words[1]);
}

}  // namespace

}  // namespace typhon::sample

int main(int argumentCount, char** arguments)
{
    return typhon::sample::runCommand({arguments + 1, arguments + argumentCount});
}
