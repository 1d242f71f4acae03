#include "simulation/allowance.h"

#include <algorithm>

namespace typhon::simulation {

namespace {

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles";
const std::string fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
const std::string assetStore = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

class ReplyCheck {
public:
    ReplyCheck(const Allowance& allowance, const std::vector<SimulatedSandbox::IssuedExtension>& issued)
        : allowance_(allowance), issued_(issued)
    {}

    std::vector<std::string> check(const std::optional<PropertyList>& reply)
    {
        expect(reply.has_value() == allowance_.isAnswered,
               reply ? "a reply for nobody" : "null for a client");
        if (reply) {
            checkKeys(*reply);
            checkFonts(reply->find("fontsInfo"));
        }
        return std::move(violations_);
    }

private:
    void expect(bool isRight, const std::string& violation)
    {
        if (!isRight) {
            violations_.push_back(violation);
        }
    }

    void checkKeys(const PropertyList& reply)
    {
        for (const auto& [key, value] : *reply.asDictionary()) {
            if (key == "extension") {
                expect(allowance_.isEnumerating, "the enumeration extension without enumeration");
                expectGrant(value, fontFiles);
            } else if (key == "extension.fontasset") {
                expect(allowance_.isEnumerating, "the font-asset extension without enumeration");
                expectGrant(value, fontAssets);
            } else if (key == "extension.provider") {
                expect(allowance_.ownDirectory.has_value(), "a provider extension for no provider");
                expectGrant(value, fontFiles + "/" + allowance_.ownDirectory.value_or("?"));
            } else if (key == "hide-profilefonts") {
                expect(value.isTrue(), "hide-profilefonts that is not true");
            } else {
                expect(key == "fontsInfo", "an unknown key " + key);
            }
        }
        const bool hides = reply.find("hide-profilefonts") != nullptr;
        expect(hides == (!allowance_.isEnumerating && !allowance_.hasFontAccess),
               "hide-profilefonts is not as it should be");
    }

    void checkFonts(const PropertyList* fonts)
    {
        if (fonts == nullptr || fonts->asDictionary() == nullptr) {
            violations_.emplace_back("no fontsInfo");
            return;
        }
        for (const auto& [path, entry] : *fonts->asDictionary()) {
            expect(allowance_.paths.contains(path), "a path outside the client's grants: " + path);
            expect(entry.find("disabled") == nullptr, "an entry with its disabled key: " + path);
            if (const auto* data = entry.find("data")) {
                expect(allowance_.isSandboxed && !allowance_.isEnumerating && !path.starts_with(assetStore),
                       "an entry with data that nobody needs: " + path);
                expectGrant(*data, path);
            }
        }
    }

    /// The data must be an extension that was issued for this path to this very client.
    void expectGrant(const PropertyList& data, const std::string& path)
    {
        const auto* bytes = data.asData();
        const bool isIssued =
            bytes != nullptr && !bytes->bytes.empty() && bytes->bytes.back() == 0 &&
            std::ranges::any_of(issued_, [&](const SimulatedSandbox::IssuedExtension& extension) {
                return extension.token == allowance_.token && extension.path == path &&
                       std::equal(extension.text.begin(), extension.text.end(), bytes->bytes.begin(),
                                  bytes->bytes.end() - 1);
            });
        expect(isIssued, "an extension that was not issued to this client for " + path);
    }

    const Allowance& allowance_;
    const std::vector<SimulatedSandbox::IssuedExtension>& issued_;
    std::vector<std::string> violations_;
};

}  // namespace

std::vector<std::string> violations(const std::optional<PropertyList>& reply, const Allowance& allowance,
                                    const std::vector<SimulatedSandbox::IssuedExtension>& issued)
{
    return ReplyCheck(allowance, issued).check(reply);
}

}  // namespace typhon::simulation
