#include "simulation/allowance.h"

#include <gtest/gtest.h>

// The simulation is worth as much as its checks: each of them must fail when it should.

namespace typhon::simulation {
namespace {

using Dictionary = PropertyList::Dictionary;

const AuditToken client{.processIdentifier = 7, .processInstance = 7};
const AuditToken somebodyElse{.processIdentifier = 8, .processInstance = 8};
const std::string path = "/var/mobile/Library/UserFonts/FontFiles/X/a.ttf";

PropertyList dataOf(const std::string& text)
{
    Data data{{text.begin(), text.end()}};
    data.bytes.push_back(0);
    return data;
}

class AllowanceTest : public testing::Test {
protected:
    std::size_t violationsIn(std::optional<PropertyList> reply) const
    {
        return violations(reply, allowance, issued).size();
    }
    static PropertyList listing(Dictionary fonts) { return Dictionary{{"fontsInfo", std::move(fonts)}}; }

    Allowance allowance{.token = client, .isAnswered = true, .hasFontAccess = true, .paths = {path}};
    std::vector<SimulatedSandbox::IssuedExtension> issued{{client, path, "a grant"},
                                                          {somebodyElse, path, "somebody else's"}};
};

TEST_F(AllowanceTest, AReplyWithinTheAllowanceIsFine)
{
    EXPECT_EQ(violationsIn(listing({})), 0U);
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"data", dataOf("a grant")}}}})), 0U);
}

TEST_F(AllowanceTest, APathOutsideTheAllowanceIsAViolation)
{
    EXPECT_EQ(violationsIn(listing({{"/other.ttf", Dictionary{}}})), 1U);
}

TEST_F(AllowanceTest, SomebodyElsesGrantOrAForgedOneIsAViolation)
{
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"data", dataOf("somebody else's")}}}})), 1U);
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"data", dataOf("forged")}}}})), 1U);
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"data", "a grant"}}}})), 1U);
}

TEST_F(AllowanceTest, AnExtensionBeyondTheCapabilitiesIsAViolation)
{
    issued.push_back({client, "/var/mobile/Library/UserFonts/FontFiles", "all"});
    auto reply = *listing({}).asDictionary();
    reply.emplace("extension", dataOf("all"));
    EXPECT_EQ(violationsIn(reply), 1U);
    allowance.isEnumerating = true;
    EXPECT_EQ(violationsIn(reply), 0U);
}

TEST_F(AllowanceTest, DataForAnUnsandboxedClientIsAViolation)
{
    allowance.isSandboxed = false;
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"data", dataOf("a grant")}}}})), 1U);
}

TEST_F(AllowanceTest, ADisabledKeyAMissingFontsInfoAndAnUnknownKeyAreViolations)
{
    EXPECT_EQ(violationsIn(listing({{path, Dictionary{{"disabled", false}}}})), 1U);
    EXPECT_EQ(violationsIn(PropertyList(Dictionary{})), 1U);
    EXPECT_EQ(violationsIn(PropertyList(Dictionary{{"fontsInfo", Dictionary{}}, {"secret", 1}})), 1U);
}

TEST_F(AllowanceTest, HidingProfileFontsWronglyIsAViolation)
{
    auto reply = *listing({}).asDictionary();
    reply.emplace("hide-profilefonts", true);
    EXPECT_EQ(violationsIn(reply), 1U);
    allowance.hasFontAccess = false;
    EXPECT_EQ(violationsIn(reply), 0U);
    EXPECT_EQ(violationsIn(listing({})), 1U);
}

TEST_F(AllowanceTest, AReplyForNobodyAndNullForAClientAreViolations)
{
    EXPECT_EQ(violationsIn(std::nullopt), 1U);
    allowance.isAnswered = false;
    EXPECT_EQ(violationsIn(std::nullopt), 0U);
    EXPECT_EQ(violationsIn(listing({})), 1U);
}

}  // namespace
}  // namespace typhon::simulation
