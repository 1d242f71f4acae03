#include "fontmanager/font_names.h"
#include "fontmanager/font_zygote_process.h"
#include "platform/linux/helper_program.h"

int main(int count, char** arguments)
{
    constexpr const char* usage =
        "typhon-font-parser reads the names in font files, each in a confined process of its own.\n"
        "It is started by the programs that install fonts, with a socket to them as standard input,\n"
        "and serves nobody else.\n";
    if (const auto status = typhon::exitUnlessStartedByUs(count, arguments, usage)) {
        return *status;
    }
    return typhon::runFontZygote(typhon::readFontNamesOfSize);
}
