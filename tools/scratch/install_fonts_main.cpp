#include "fontmanager/install_fonts.h"

#include <filesystem>
#include <iostream>

#include <CLI/CLI.hpp>

// Puts font files into a scratch system as a provider would, so that there is something to show. It writes
// the registry itself, and the daemon reads the registry when it starts.

int main(int argc, char** argv)
{
    CLI::App app{"Installs font files for a provider into a scratch system; for ./run and by hand."};
    std::string root;
    std::string provider;
    std::vector<std::string> files;
    bool isDisabled = false;
    app.add_option("--root", root, "Folder of the scratch system")->required();
    app.add_flag("--disabled", isDisabled, "Register them switched off");
    app.add_option("PROVIDER", provider, "Identifier of the provider")->required();
    app.add_option("FILE", files, "Font files")->required();
    CLI11_PARSE(app, argc, argv);

    const typhon::RootDirectory folder(std::filesystem::absolute(root).string());
    const auto installation = typhon::installFontFiles(folder, provider, files, !isDisabled);
    if (installation.error) {
        std::cerr << "install-fonts: " << *installation.error << "\n";
        return 1;
    }
    return 0;
}
