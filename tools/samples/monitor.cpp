#include "faces_in_file.h"
#include "platform/linux/visible_text.h"
#include "sample.h"

#include <iostream>

namespace typhon::sample {

namespace {

void printFiles(const char* what, const std::vector<std::string>& urls)
{
    std::cout << what;
    for (const auto& url : urls) {
        std::cout << " " << visibleText(url);
    }
}

/// How many of the fonts that came can be read.
std::size_t readableFonts(TyphonClient& client, const PropertyList::Dictionary& fonts)
{
    std::size_t readable = 0;
    for (const auto& [path, entry] : fonts) {
        const auto file = client.openFont(path);
        readable += file && !facesInFile(file->get()).empty() ? 1 : 0;
    }
    return readable;
}

void printChange(TyphonClient& client, const FontChangeNotice& change)
{
    std::cout << identifier << " is told:";
    if (change.addedURLStrings) {
        const auto fonts = fontsIn(change.info.value_or(PropertyList()));
        printFiles(" added", *change.addedURLStrings);
        std::cout << " (reads " << readableFonts(client, fonts) << " of " << fonts.size() << ")";
    }
    if (change.removedURLStrings) {
        printFiles(" removed", *change.removedURLStrings);
    }
    std::cout << std::endl;
}

}  // namespace

int monitor(TyphonClient& client, unsigned long count)
{
    const auto view = checkIn(client);
    if (!view) {
        return complain(view.error());
    }
    std::cout << identifier << " waits for changes" << std::endl;
    for (unsigned long heard = 0; count == 0 || heard < count;) {
        const auto change = client.waitForChange();
        if (!change) {
            return complain(change.error());
        }
        if (*change) {
            printChange(client, **change);
            ++heard;
        }
    }
    return 0;
}

}  // namespace typhon::sample
