#include "faces_in_file.h"
#include "platform/linux/visible_text.h"
#include "sample.h"
#include "sdk/font_picker_client.h"

#include <iostream>

#include <unistd.h>

namespace typhon::sample {

int receivePicked()
{
    auto client = FontPickerClient::listen();
    if (!client) {
        return complain(client.error());
    }
    if (!sendDescriptor(STDIN_FILENO, client->endpoint().get())) {
        std::cerr << identifier << ": standard input is no socket to the font picker\n";
        return 1;
    }
    PropertyList fonts;
    const auto waited = client->waitForFonts([&fonts](const PropertyList& picked) {
        fonts = picked;
        return true;
    });
    if (!waited) {
        return complain(waited.error());
    }
    std::size_t readable = 0;
    for (const auto& [path, entry] : *fonts.asDictionary()) {
        printFont(path, entry);
        const auto file = client->openFont(path);
        readable += file && !facesInFile(file->get()).empty() ? 1 : 0;
    }
    std::cout << identifier << " was handed " << fonts.asDictionary()->size() << " font files and read "
              << readable << "\n";
    return 0;
}

}  // namespace typhon::sample
