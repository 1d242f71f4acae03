// How an application asks for fonts that it does not have.

#include "platform/linux/bus_message.h"
#include "sdk/client_errors.h"
#include "sdk/font_opener.h"
#include "sdk/received_changes.h"
#include "sdk/service_connection.h"
#include "sdk/typhon_client.h"

#include <cerrno>

#include <fcntl.h>

namespace typhon {

namespace {

/// The attributes of the text engine by which a font is asked for.
constexpr const char* familyAttribute = "LFFontFamilyNameAttribute";
constexpr const char* nameAttribute = "LFFontNameAttribute";

void addRequests(PropertyList::Array& requests, const char* attribute, const std::vector<std::string>& names)
{
    for (const auto& name : names) {
        requests.push_back(PropertyList::Dictionary{{attribute, name}});
    }
}

}  // namespace

ClientResult<PropertyList> TyphonClient::requestFonts(const std::vector<std::string>& families,
                                                      const std::vector<std::string>& postScriptNames)
{
    PropertyList::Array requests;
    addRequests(requests, familyAttribute, families);
    addRequests(requests, nameAttribute, postScriptNames);
    const auto outcome = call(wire::requestFonts, {PropertyList(std::move(requests))});
    if (!outcome) {
        return outcome.error();
    }
    auto fonts = std::get<PropertyList>(outcome->front());
    changes_->addFonts(fonts);
    return fonts;
}

ClientResult<bool> TyphonClient::requestFontsForClient(const std::string& postScriptName,
                                                       const FileDescriptor& endpoint)
{
    FileDescriptor copy(::fcntl(endpoint.get(), F_DUPFD_CLOEXEC, 3));
    if (!copy) {
        return systemError(errno, "cannot pass the endpoint on");
    }
    std::shared_ptr<TransferredFile> file = std::make_shared<LinuxTransferredFile>(std::move(copy));
    const auto outcome = call(wire::requestFontsForClient, {PropertyList(postScriptName), std::move(file)});
    if (!outcome) {
        return outcome.error();
    }
    return std::get<PropertyList>(outcome->front()).isTrue();
}

}  // namespace typhon
