// One more path in a large ledger of issued fonts.

#include "platform/linux/durable_file.h"
#include "platform/linux/linux_code_signing.h"
#include "platform/linux/linux_preferences.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_platform.h"
#include "requests/issued_paths_ledger.h"
#include "rows.h"
#include "sample_registry.h"

namespace typhon::bench {

namespace {

constexpr int applications = 1'000;
constexpr int pathsEach = 100;
constexpr int fonts = 5'000;

PropertyList fullLedger()
{
    PropertyList::Dictionary issues;
    for (int application = 0; application < applications; ++application) {
        PropertyList::Array paths;
        for (int index = 0; index < pathsEach; ++index) {
            const auto path = sampleFontPath((application * 37 + index) % fonts);
            paths.emplace_back("U/" +
                               path.substr(std::string("/var/mobile/Library/UserFonts/FontFiles/").size()));
        }
        issues.emplace("org.example.application" + std::to_string(application), std::move(paths));
    }
    return issues;
}

}  // namespace

void measureLedger(Report& report)
{
    Report::begin("Recording in a ledger of 1,000 applications with 100 paths each");
    const ScratchDirectory folder;
    SimulatedPlatform simulated;
    simulated.fileSystem.addFile(UserFontRegistry::path, sampleRegistry(fonts));
    LinuxPreferences preferences(RootDirectory(folder.path()), simulated.log);
    preferences.setValue("issues", fullLedger());
    preferences.synchronize();
    UserFontUpdates updates(simulated.platform.processWideQueues);
    UserFontRegistry registry(simulated.fileSystem, simulated.log, updates);
    simulated.run([](UserFontRegistry& loaded) -> Task<void> {
        loaded.isUserFontInstalled();
        co_return;
    }(registry));
    IssuedPathsLedger ledger(preferences, simulated.codeSigning, registry);

    int next = 0;
    const Step ours = timed([&] {
        ++next;
        ledger.recordIssuedFontPaths({sampleFontPath((next * 53 + 200) % fonts)},
                                     "org.example.application" + std::to_string(next % applications));
        return 0;
    });
    const auto path = folder.real("/peer.plist");
    const auto ledgerValue = fullLedger();
    const Step peer = timed([&] {
        const auto bytes = writeBinaryPropertyList(PropertyList::Dictionary{{"issues", ledgerValue}});
        return replaceFile(path, bytes, 0600);
    });
    report.add({"one record in a ledger of 1,000 applications with 100 paths each",
                "encoding that ledger and replacing the file durably",
                compare(ours, peer, {.rounds = 15, .steps = 3, .warmUp = 2}), 1.2});
}

}  // namespace typhon::bench
