#include "simulation/simulated_changes.h"

#include "platform/file_url.h"
#include "platform/font_directories.h"
#include "protocol/wire.h"

#include <algorithm>

namespace typhon::simulation {

namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

const std::string profileFonts = "/var/mobile/Library/Fonts/Managed/";

bool isProfileFont(const std::string& path)
{
    return path.starts_with(profileFonts);
}

bool isInUserDirectories(const std::string& path)
{
    return path.starts_with(font_directories::fontFiles) || path.starts_with(font_directories::fontAssets);
}

class ChangeCheck {
public:
    ChangeCheck(const HeardChange& change, const ChangeAllowance& allowance,
                const std::vector<SimulatedSandbox::IssuedExtension>& issued)
        : change_(change), allowance_(allowance), issued_(issued)
    {}

    std::vector<std::string> check()
    {
        const bool hearsOfUserFonts = allowance_.isEnumerating || allowance_.ownDirectory;
        for (const auto& url : change_.added) {
            const auto path = pathFromFileUrl(url).value_or("?");
            expect(isProfileFont(path) || mayBeAdded(path), "an added font of no concern: " + url);
        }
        for (const auto& url : change_.removed) {
            const auto path = pathFromFileUrl(url).value_or("?");
            expect(isProfileFont(path) || hearsOfUserFonts, "a removed font of no concern: " + url);
        }
        expect(change_.added.empty() || change_.removed.empty(), "fonts that came and fonts that went");
        if (change_.info) {
            checkInfo(*change_.info);
        }
        return std::move(violations_);
    }

private:
    void expect(bool isRight, const std::string& violation)
    {
        if (!isRight) {
            violations_.push_back("told of a change: " + violation);
        }
    }

    bool mayBeAdded(const std::string& path) const
    {
        const auto directory = font_directories::nameOfDirectoryHolding(path);
        return isInUserDirectories(path) &&
               (allowance_.isEnumerating || directory == allowance_.ownDirectory);
    }

    void checkInfo(const PropertyList& info)
    {
        expect(change_.removed.empty() || info == PropertyList(), "an info of fonts that went");
        for (const auto& [key, value] : *info.asDictionary()) {
            if (key == "extension.provider") {
                checkExtension(value);
            } else if (key == "fontsInfo" && value.asDictionary() != nullptr) {
                checkFonts(*value.asDictionary());
            } else {
                expect(false, "an unknown key " + key);
            }
        }
    }

    void checkFonts(const Dictionary& fonts)
    {
        for (const auto& [path, entry] : fonts) {
            expect(std::ranges::find(change_.added, fileUrlFromPath(path)) != change_.added.end(),
                   "an entry without its URL: " + path);
            expect(isProfileFont(path) || allowance_.paths.contains(path),
                   "a path outside the client's grants: " + path);
            expect(entry.find("disabled") == nullptr && entry.find("data") == nullptr,
                   "an entry with a key too many: " + path);
        }
    }

    void checkExtension(const PropertyList& data)
    {
        const auto* bytes = data.asData();
        const auto path = std::string(font_directories::fontFiles) + allowance_.ownDirectory.value_or("?");
        const bool isIssued =
            bytes != nullptr && std::ranges::any_of(issued_, [&](const auto& extension) {
                return extension.token == allowance_.token && extension.path == path &&
                       extension.text + '\0' == std::string(bytes->bytes.begin(), bytes->bytes.end());
            });
        expect(isIssued && !allowance_.isEnumerating, "an extension that is not this provider's");
    }

    const HeardChange& change_;
    const ChangeAllowance& allowance_;
    const std::vector<SimulatedSandbox::IssuedExtension>& issued_;
    std::vector<std::string> violations_;
};

}  // namespace

std::vector<std::string> violations(const HeardChange& change, const ChangeAllowance& allowance,
                                    const std::vector<SimulatedSandbox::IssuedExtension>& issued)
{
    return ChangeCheck(change, allowance, issued).check();
}

Task<void> ChangeListener::handle(std::shared_ptr<IncomingCall> call)
{
    const auto value = [&](std::size_t index) {
        return wire::fromNullable(std::get<PropertyList>(call->arguments().at(index)));
    };
    hearing_({value(0), stringsOf(value(1).value_or(Array{})), stringsOf(value(2).value_or(Array{}))});
    co_return;
}

PropertyList someReport(World& world)
{
    auto& scheduler = world.simulated.scheduler;
    const bool isOfProfiles = scheduler.pick(4) == 0;
    Dictionary report;
    Array urls;
    for (auto count = scheduler.pick(5); count != 0; --count) {
        const auto path = isOfProfiles ? profileFonts + std::to_string(scheduler.pick(3)) + ".ttf"
                                       : world.registry.somePath();
        urls.emplace_back(fileUrlFromPath(path));
        if (scheduler.pick(5) == 0) {
            urls.emplace_back(scheduler.pick(2) == 0 ? PropertyList("no url") : PropertyList(7));
        }
    }
    report.emplace("urls", scheduler.pick(12) == 0 ? PropertyList("file:///a") : PropertyList(urls));
    if (scheduler.pick(10) != 0) {
        report.emplace("added", scheduler.pick(3) != 0);
    }
    if (isOfProfiles || scheduler.pick(2) == 0) {
        report.emplace("kind", isOfProfiles ? 1 : 0);
    }
    return report;
}

PropertyList reportOfAdded(const std::set<std::string>& paths)
{
    Array urls;
    for (const auto& path : paths) {
        urls.emplace_back(fileUrlFromPath(path));
    }
    return Dictionary{{"urls", std::move(urls)}, {"added", true}, {"kind", 0}};
}

}  // namespace typhon::simulation
