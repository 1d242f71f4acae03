#include "protocol/wire.h"

#include <algorithm>
#include <initializer_list>

namespace typhon::wire {

namespace {

/// Groups operations by interface, keeping their order.
InterfaceDescriptions describe(std::initializer_list<Operation> operations)
{
    auto interfaces = std::make_shared<std::vector<InterfaceDescription>>();
    for (const auto& operation : operations) {
        auto place = std::ranges::find(*interfaces, operation.interface, &InterfaceDescription::name);
        if (place == interfaces->end()) {
            place = interfaces->insert(interfaces->end(), {operation.interface, {}});
        }
        place->members.push_back(
            {operation.member, operation.inTypes, operation.outTypes, operation.answer == Answer::once});
    }
    return interfaces;
}

}  // namespace

InterfaceDescriptions typhonDaemonInterfaces()
{
    static const auto interfaces =
        describe({checkin, checkinForFontPicker, requestFonts, requestFontsForClient, fontChanged,
                  updatingUserFonts, scheduleFontFilesDeletion, synchronizeFontAssets, resetIssuedFontsFor,
                  checkinForSilkpageProcess, sendFonts});
    return interfaces;
}

InterfaceDescriptions typhonClientInterfaces()
{
    static const auto interfaces = describe({fontAddedInfo});
    return interfaces;
}

InterfaceDescriptions typhonFontPickerClientSupportInterfaces()
{
    static const auto interfaces = describe({pingFontPickerClient, activateFontsForFontPickerClient});
    return interfaces;
}

InterfaceDescriptions typhonSilkpageSupportServerInterfaces()
{
    static const auto interfaces = describe({pingSilkpageProcess, userInstalledFontsInfo});
    return interfaces;
}

InterfaceDescriptions fontInstallViewServiceInterfaces()
{
    static const auto interfaces = describe({doneWithMissingFonts});
    return interfaces;
}

PropertyList nullable(std::optional<PropertyList> value)
{
    PropertyList::Array array;
    if (value) {
        array.push_back(*std::move(value));
    }
    return array;
}

std::optional<PropertyList> fromNullable(const PropertyList& array)
{
    const auto* values = array.asArray();
    return values == nullptr || values->empty() ? std::nullopt : std::optional(values->front());
}

}  // namespace typhon::wire
