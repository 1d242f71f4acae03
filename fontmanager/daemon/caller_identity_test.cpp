#include "fontmanager/daemon/caller_identity.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

constexpr std::uint32_t ownUser = 1000;

CallerIdentity caller(std::optional<std::string> identifier, PropertyList capabilities, bool isSandboxed,
                      std::uint32_t user = ownUser)
{
    CallerIdentity identity{.signature = {.signingIdentifier = std::move(identifier), .entitlements = {}},
                            .isSandboxed = isSandboxed,
                            .user = user};
    identity.signature.entitlements.emplace("com.vorlan.developer.user-fonts", std::move(capabilities));
    return identity;
}

PropertyList list(std::initializer_list<PropertyList> values)
{
    return PropertyList::Array(values);
}

TEST(CallerIdentityTest, AProviderHasTheEntitlementAndAnIdentifier)
{
    EXPECT_TRUE(isFontProvider(caller("org.example.a", list({"system-installation"}), true)));
    EXPECT_TRUE(
        isFontProvider(caller("org.example.a", list({7, "app-usage", "system-installation"}), false)));
    EXPECT_FALSE(isFontProvider(caller(std::nullopt, list({"system-installation"}), true)));
    EXPECT_FALSE(isFontProvider(caller("org.example.a", list({"font-enumeration", "app-usage"}), true)));
}

TEST(CallerIdentityTest, AnEntitlementOfAnotherShapeIsNone)
{
    EXPECT_FALSE(isFontProvider(caller("org.example.a", "system-installation", true)));
    EXPECT_FALSE(isFontProvider(caller("org.example.a", true, true)));
    EXPECT_FALSE(isFontProvider(
        caller("org.example.a", PropertyList::Dictionary{{"system-installation", true}}, true)));
    EXPECT_FALSE(isFontProvider(CallerIdentity{}));
}

TEST(CallerIdentityTest, AdministratorsAreUnsandboxedAndNoApplications)
{
    const OwnUser own{.user = ownUser};
    EXPECT_TRUE(isAdministrator(caller(std::nullopt, list({}), false), own));
    EXPECT_TRUE(isAdministrator(caller("com.vorlan.typhonctl", list({}), false), own));
    EXPECT_TRUE(isAdministrator(caller(std::nullopt, list({}), false, 0), own));
    EXPECT_FALSE(isAdministrator(caller(std::nullopt, list({}), true), own));
    EXPECT_FALSE(isAdministrator(caller("com.vorlan.typhonctl", list({}), true), own));
    EXPECT_FALSE(isAdministrator(caller("org.example.a", list({}), false), own));
    EXPECT_FALSE(isAdministrator(caller(std::nullopt, list({}), false, 1001), own));
}

TEST(CallerIdentityTest, TheSystemsServicesAreTrustedWhereverTheyAreConfined)
{
    const OwnUser own{.user = ownUser, .isServiceUser = true};
    EXPECT_TRUE(isAdministrator(caller(std::nullopt, list({}), true), own));
    EXPECT_FALSE(isAdministrator(caller(std::nullopt, list({}), true, 0), own));
    EXPECT_FALSE(isAdministrator(caller(std::nullopt, list({}), false, 1001), own));
}

}  // namespace
}  // namespace typhon
