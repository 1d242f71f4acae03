#include "platform/linux/property_list_writer.h"
#include "tools/commands/command.h"
#include "tools/property_list_file.h"
#include "tools/property_list_json.h"
#include "tools/property_list_text.h"

namespace typhon {

namespace {

struct Options {
    std::string file;
    bool xml = false;
    bool binary = false;
};

int plist(const Invocation& invocation, const Options& options)
{
    const auto value = readPropertyListFile(options.file);
    if (!value) {
        return fail(value.error());
    }
    if (options.xml) {
        return print(writeXmlPropertyList(*value));
    }
    if (options.binary) {
        const auto bytes = writeBinaryPropertyList(*value);
        return print({reinterpret_cast<const char*>(bytes.data()), bytes.size()});
    }
    return invocation.json ? printJson(jsonOf(*value)) : print(propertyListText(*value));
}

void declare(CLI::App& command, Options& options)
{
    command.add_option("file", options.file, "An XML or binary property list; - for standard input")
        ->required()
        ->type_name("FILE");
    auto* xml = command.add_flag("--xml", options.xml, "Write it as XML");
    command.add_flag("--binary", options.binary, "Write it in the binary form")->excludes(xml);
}

}  // namespace

void addPlistCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "plist", "Print or convert a property list", plist, declare);
}

}  // namespace typhon
