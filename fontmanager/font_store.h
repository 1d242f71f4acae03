#pragma once

#include "fontmanager/change_journal.h"
#include "fontmanager/font_registration.h"
#include "fontmanager/provider_directories.h"
#include "fontmanager/registry_writer.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// What a change means for those who use fonts: logical paths of font files.
struct RegistryChange {
    /// Came to be there or were switched on, or are others under the same name.
    std::vector<std::string> available;
    /// Were removed or switched off.
    std::vector<std::string> gone;
    /// The registry is another one now, even if nobody can see a difference.
    bool isRegistryChanged = false;
};

/// What an operation did, or why it did nothing.
struct RegistryChangeOutcome {
    RegistryChange change;
    std::optional<std::string> error;
};

/// The registry of fonts and the directories of the providers' font files, changed together: one process has
/// them open at a time. A change is all or none, also when the process is killed in its middle: it is written
/// into the journal before the first file moves and completed by the next run, in this order: new files take
/// their places, the registry is replaced, removed files go. So no registered file is ever missing. Any
/// thread; operations block on the disk and on each other.
class FontStore {
public:
    /// `log` outlives this.
    FontStore(RootDirectory root, ReadFontNames readNames, Log& log, RegistrationLimits limits = {});

    /// Takes the store for this process, completes a change that was interrupted, and removes copies that
    /// nobody will use. The change that was completed, or may not have been reported, if any: it is under way
    /// until `changeWasReported`. Once, before anything else.
    RegistryChangeOutcome open();
    /// A change of the registry, by the store or by others in this process, is under way from now on.
    void changeBegins();
    /// One of those under way has been reported. Until that can be said of all, what the latest one of the
    /// store placed or removed is given once more by the next run.
    void changeWasReported();

    struct Beginning {
        std::unique_ptr<FontRegistration> registration;
        std::optional<std::string> error;
    };
    /// Begins a registration for the provider with that identifier. It must not outlive the store.
    Beginning begin(const std::string& identifier, bool enabled);

    // What each of these gives includes a change before it that had failed in its middle and is complete now;
    // so it may come with an error too.

    /// Registers the files of a registration and takes them from it. Files of the same names are replaced.
    RegistryChangeOutcome commit(FontRegistration& registration);

    /// Unregisters font files in providers' directories and removes them; fails when one is not registered.
    RegistryChangeOutcome unregister(const std::vector<std::string>& paths);
    /// The same for everything in a provider's directory.
    RegistryChangeOutcome unregisterAll(const std::string& identifier);
    /// Switches registered fonts on or off; fails when one is not registered.
    RegistryChangeOutcome setEnabled(const std::vector<std::string>& paths, bool enabled);
    /// Unregisters font files of providers that are gone, and removes directories that hold nothing.
    RegistryChangeOutcome synchronizeProviders();

private:
    RegistryChangeOutcome inTurn(const std::function<RegistryChangeOutcome()>& operation);
    RegistryChangeOutcome completeInterruptedChange();
    std::optional<std::string> eraseCompletedChange();
    RegistryChangeOutcome commitFiles(FontRegistration& registration);
    RegistryChangeOutcome apply(PendingChange change, bool isJournalled);
    std::optional<std::string> place(const PendingChange& change);
    void removeFiles(const std::vector<std::string>& paths);
    bool isFileThere(const std::string& path);
    void dropLostPlacements(PendingChange& change);
    void sweepCopies();

    const RootDirectory root_;
    const ReadFontNames readNames_;
    const RegistrationLimits limits_;
    Log& log_;
    ProviderDirectories directories_;
    RegistryWriter registry_;

    std::mutex mutex_;
    // Below: protected by the mutex.
    ChangeJournal journal_;
    /// The change in the journal is complete, but may not have been reported.
    bool isJournalComplete_ = false;
    unsigned changesUnderWay_ = 0;
    std::optional<FileLock> lock_;
    std::uint64_t serial_ = 0;
};

}  // namespace typhon
