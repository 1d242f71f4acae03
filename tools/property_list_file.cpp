#include "tools/property_list_file.h"

#include "platform/ipc.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/regular_file.h"
#include "sdk/client_errors.h"

#include <unistd.h>

namespace typhon {

namespace {

ClientResult<PropertyList> readFrom(int descriptor, const std::string& name)
{
    const auto reading = readPropertyListFromDescriptor(descriptor);
    if (!reading.value) {
        return ClientError{ipc_errors::failed, name + " is not a sound property list: " + reading.error,
                           "Name a file with an XML or binary property list."};
    }
    return *reading.value;
}

}  // namespace

ClientResult<PropertyList> readPropertyListFile(const std::string& path)
{
    if (path == "-") {
        return readFrom(STDIN_FILENO, "standard input");
    }
    const auto opened = openRegularFile(path);
    if (opened.error != 0) {
        auto error = systemError(opened.error, "cannot read " + path);
        error.advice = "Name a file that is there and that you may read.";
        return error;
    }
    return readFrom(opened.file.get(), path);
}

}  // namespace typhon
