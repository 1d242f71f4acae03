#include "fontmanager/font_registry_client.h"

#include "fontmanager/font_registry_wire.h"
#include "fontmanager/helper_launcher.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"
#include "sdk/client_errors.h"
#include "sdk/service_socket.h"

#include <cerrno>
#include <memory>
#include <utility>

namespace typhon {

namespace {

Arguments texts(const std::vector<std::string>& list)
{
    Arguments arguments;
    arguments.emplace_back(arrayOfStrings(list));
    return arguments;
}

}  // namespace

ClientResult<FontRegistryClient> FontRegistryClient::connect(const Options& options)
{
    auto helper = connectToHelper(chosenRoot(options.root), options.helper);
    if (!helper) {
        return helper.error();
    }
    return FontRegistryClient(std::move(*helper));
}

ClientResult<Arguments> FontRegistryClient::call(const wire::Operation& operation, const Arguments& arguments)
{
    auto results = helper_.call(operation, arguments);
    if (!results && !helper_.isOpen()) {
        auto error = results.error();
        error.message = "the helper of the font registry ended during the call (" + error.message + ")";
        error.advice = "Look at what is registered now, then try again.";
        return error;
    }
    return results;
}

ClientResult<Done> FontRegistryClient::addFile(const std::string& path)
{
    const auto opened = openRegularFile(path);
    if (opened.error != 0) {
        return clientError(opened.error == ENOENT ? client_errors::fileNotFound : ipc_errors::failed,
                           "cannot open " + visibleText(path) + ": " + opened.errorText());
    }
    // The message needs a descriptor of its own.
    const std::shared_ptr<TransferredFile> file = std::make_shared<LinuxTransferredFile>(
        FileDescriptor(::fcntl(opened.file.get(), F_DUPFD_CLOEXEC, 3)));
    Arguments arguments;
    arguments.emplace_back(file);
    arguments.emplace_back(PropertyList(path.substr(path.rfind('/') + 1)));
    const auto taken = call(font_registry_wire::addFontFile, arguments);
    return taken ? ClientResult<Done>(Done{}) : ClientResult<Done>(taken.error());
}

ClientResult<std::vector<std::string>>
FontRegistryClient::registerFonts(const std::string& identifier, const std::vector<std::string>& files,
                                  bool enabled, const Progress& progress)
{
    Arguments beginning;
    beginning.emplace_back(PropertyList(identifier));
    beginning.emplace_back(PropertyList(enabled));
    const auto begun = call(font_registry_wire::beginRegistration, beginning);
    if (!begun) {
        return begun.error();
    }
    std::size_t taken = 0;
    for (const auto& file : files) {
        if (const auto added = addFile(file); !added) {
            [[maybe_unused]] const auto cancelled = call(font_registry_wire::cancelRegistration, {});
            return added.error();
        }
        if (progress) {
            progress(++taken, files.size());
        }
    }
    const auto paths = call(font_registry_wire::commitRegistration, {});
    if (!paths) {
        return paths.error();
    }
    return stringsOf(std::get<PropertyList>(paths->at(0)));
}

ClientResult<std::int64_t> FontRegistryClient::count(const wire::Operation& operation,
                                                     const Arguments& arguments)
{
    const auto results = call(operation, arguments);
    if (!results) {
        return results.error();
    }
    return *std::get<PropertyList>(results->at(0)).asInteger();
}

ClientResult<std::int64_t> FontRegistryClient::unregisterFonts(const std::vector<std::string>& urls)
{
    return count(font_registry_wire::unregister, texts(urls));
}

ClientResult<std::int64_t> FontRegistryClient::unregisterAllFonts(const std::string& identifier)
{
    Arguments arguments;
    arguments.emplace_back(PropertyList(identifier));
    return count(font_registry_wire::unregisterAll, arguments);
}

ClientResult<std::int64_t> FontRegistryClient::enableOrDisable(const std::vector<std::string>& urls,
                                                               bool enabled)
{
    auto arguments = texts(urls);
    arguments.emplace_back(PropertyList(enabled));
    return count(font_registry_wire::enableOrDisable, arguments);
}

ClientResult<Done> FontRegistryClient::synchronizeFontProviders()
{
    const auto results = call(font_registry_wire::synchronizeFontProviders, {});
    return results ? ClientResult<Done>(Done{}) : ClientResult<Done>(results.error());
}

ClientResult<Done> FontRegistryClient::synchronizeProfileFonts()
{
    const auto results = call(font_registry_wire::synchronizeProfileFonts, {});
    return results ? ClientResult<Done>(Done{}) : ClientResult<Done>(results.error());
}

ClientResult<Done> FontRegistryClient::synchronizeFontAssets()
{
    const auto results = call(font_registry_wire::synchronizeFontAssets, {});
    return results ? ClientResult<Done>(Done{}) : ClientResult<Done>(results.error());
}

}  // namespace typhon
