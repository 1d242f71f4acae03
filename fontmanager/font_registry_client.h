#pragma once

#include "platform/linux/root_directory.h"
#include "protocol/wire.h"
#include "sdk/client_result.h"
#include "sdk/service_connection.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The font-registry library for programs that install fonts: font providers, which may touch their own fonts
/// only, and administrators' tools. Every call blocks until the helper has answered, without limit, and fails
/// at once when the helper ends. One thread at a time.
class FontRegistryClient {
public:
    struct Options {
        /// Folder of a scratch system. Null: the environment's TYPHON_ROOT, else the machine itself.
        std::optional<std::string> root;
        /// The helper's executable, should it have to be started. Null: the one that is found.
        std::optional<std::string> helper;
    };
    static ClientResult<FontRegistryClient> connect(const Options& options);
    static ClientResult<FontRegistryClient> connect() { return connect(Options{}); }

    /// Told after each file how many of how many have been taken.
    using Progress = std::function<void(std::size_t taken, std::size_t all)>;

    /// Registers font files (real paths), all or none of them, under their file names, for the provider with
    /// that identifier (empty: this program's own). Files of the same names are replaced. Gives the logical
    /// paths they have now, in order.
    ClientResult<std::vector<std::string>> registerFonts(const std::string& identifier,
                                                         const std::vector<std::string>& files, bool enabled,
                                                         const Progress& progress = {});

    // Those below give how many fonts are other than before.

    /// Unregisters fonts (file URLs) and removes their files, all or none of them.
    ClientResult<std::int64_t> unregisterFonts(const std::vector<std::string>& urls);
    /// The same for all fonts of a provider (empty: this program's own).
    ClientResult<std::int64_t> unregisterAllFonts(const std::string& identifier);
    /// Switches fonts (file URLs) on or off, all or none of them.
    ClientResult<std::int64_t> enableOrDisable(const std::vector<std::string>& urls, bool enabled);

    ClientResult<Done> synchronizeFontProviders();
    ClientResult<Done> synchronizeProfileFonts();
    ClientResult<Done> synchronizeFontAssets();

private:
    explicit FontRegistryClient(ServiceConnection helper) : helper_(std::move(helper)) {}
    ClientResult<Arguments> call(const wire::Operation& operation, const Arguments& arguments);
    ClientResult<std::int64_t> count(const wire::Operation& operation, const Arguments& arguments);
    ClientResult<Done> addFile(const std::string& path);

    ServiceConnection helper_;
};

}  // namespace typhon
