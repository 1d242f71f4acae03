#include "tools/commands/command.h"

int main(int argumentCount, char** arguments)
{
    return typhon::runCommandLine({arguments + 1, arguments + argumentCount});
}
