#include "platform/asset_service.h"
#include "platform/linux/asset_installation.h"
#include "platform/linux/asset_store.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"
#include "tools/asset_archive.h"
#include "tools/catalogue_fetch.h"
#include "tools/commands/command.h"
#include "tools/complaints.h"
#include "tools/notification_post.h"
#include "tools/property_list_file.h"
#include "tools/property_list_json.h"
#include "tools/table.h"

#include <filesystem>

namespace typhon {

namespace {

namespace fs = std::filesystem;

struct TypeOptions {
    std::string type = asset_types::fonts;
};
struct AssetOptions : TypeOptions {
    std::string assetId;
    /// A folder or an archive.
    std::string source;
};
struct CatalogueOptions : TypeOptions {
    std::string key;
    std::string output;
    std::string folder;
    std::int64_t version = 1;
};
struct FileOptions : TypeOptions {
    std::string file;
};

constexpr const char* storeAdvice = "Only root and the user typhon may change the asset store; use sudo.";

std::string nameOfState(std::int64_t state)
{
    switch (state) {
    case asset_states::listed:
        return "listed";
    case asset_states::installed:
        return "installed";
    default:
        return "no longer listed";
    }
}

/// A system without a bus works on: the daemon looks at the catalogue when it is next told to.
int announce(const Invocation& invocation, const std::string& type, const std::string& what)
{
    if (const auto posted = postNotification(invocation.root(), type + ".kg." + what, std::nullopt);
        !posted) {
        return print("Not announced: " + posted.error().message + "\n");
    }
    return exitSuccess;
}

PropertyList listed(const StoredAsset& asset, const std::optional<std::uint64_t>& size)
{
    PropertyList::Dictionary entry{
        {"assetId", asset.assetId}, {"attributes", asset.attributes}, {"state", asset.state}};
    if (size) {
        entry.emplace("size", static_cast<std::int64_t>(*size));
    }
    return entry;
}

int list(const Invocation& invocation, const TypeOptions& options)
{
    Complaints complaints;
    const auto root = invocation.root();
    AssetStore store(root, complaints);
    const auto listing = store.assets(options.type);
    if (listing.error) {
        return fail(*listing.error);
    }
    PropertyList::Array assets;
    Table table({"ASSET", "STATE", "SIZE"});
    for (const auto& asset : listing.assets) {
        const auto size = store.sizeOf(options.type, asset.assetId);
        assets.push_back(listed(asset, size));
        table.addRow({asset.assetId, nameOfState(asset.state), size ? std::to_string(*size) : "-"});
    }
    if (invocation.json) {
        return printJson(jsonOf(PropertyList(std::move(assets))));
    }
    return print(table.rowCount() == 0 ? "There are no assets of " + options.type + ".\n" : table.text());
}

int install(const Invocation& invocation, const AssetOptions& options)
{
    Complaints complaints;
    const auto root = invocation.root();
    std::error_code notThere;
    const auto files = fs::is_directory(options.source, notThere)
                           ? fromFolder(options.source)
                           : fromArchive(options.source, options.assetId);
    if (const auto error = AssetStore(root, complaints).install(options.type, options.assetId, files)) {
        return fail(*error, storeAdvice);
    }
    return announce(invocation, options.type, "new-asset-installed");
}

int purge(const Invocation& invocation, const AssetOptions& options)
{
    Complaints complaints;
    const auto root = invocation.root();
    const auto error = AssetStore(root, complaints).purge(options.type, options.assetId);
    return error ? fail(*error, storeAdvice) : exitSuccess;
}

/// Adds the asset that a folder is; its attributes lie beside it.
ClientResult<Done> addAsset(AssetCatalogue& catalogue, const fs::path& folder)
{
    auto digests = digestsOfFolder(folder.string());
    if (!digests.value) {
        return ClientError{{}, digests.error, "An asset is a folder of files, without folders in it."};
    }
    ListedAsset asset{{}, *std::move(digests.value)};
    const auto attributes = folder.string() + ".plist";
    if (fs::exists(attributes)) {
        const auto value = readPropertyListFile(attributes);
        if (!value || value->asDictionary() == nullptr) {
            return ClientError{{}, attributes + " is no dictionary of attributes", {}};
        }
        asset.attributes = *value->asDictionary();
    }
    catalogue.assets.emplace(folder.filename().string(), std::move(asset));
    return Done{};
}

int makeCatalogueFile(const Invocation&, const CatalogueOptions& options)
{
    const auto key = readSigningKeyFile(options.key);
    if (!key.value) {
        return fail(options.key + ": " + key.error, "Make a key: typhonctl keygen --key FILE");
    }
    AssetCatalogue catalogue{options.type, options.version, {}};
    std::error_code error;
    for (const auto& entry : fs::directory_iterator(options.folder, error)) {
        if (!entry.is_directory()) {
            continue;
        }
        if (const auto added = addAsset(catalogue, entry.path()); !added) {
            return fail(added.error().message, added.error().advice);
        }
    }
    if (error) {
        return fail(options.folder + ": " + error.message());
    }
    const auto contents = makeCatalogue(*key.value, catalogue);
    if (!contents.value) {
        return fail("the catalogue would not be read again: " + contents.error);
    }
    const auto failure = replaceFile(fs::absolute(options.output).string(), *contents.value, 0644);
    return failure ? fail(*failure) : exitSuccess;
}

int fetch(const Invocation& invocation, const TypeOptions& options)
{
    const auto fetched = fetchCatalogue(invocation.root(), options.type);
    return fetched ? print(*fetched) : fail(fetched.error().message, fetched.error().advice);
}

int setCatalogue(const Invocation& invocation, const FileOptions& options)
{
    const auto opened = openRegularFile(options.file);
    const auto contents =
        opened.error == 0 ? readWhole(opened.file.get(), catalogueFileLimit) : FileContents{};
    if (opened.error != 0 || contents.error != 0) {
        return fail(options.file + ": " + errorText(opened.error != 0 ? opened.error : contents.error));
    }
    Complaints complaints;
    const auto root = invocation.root();
    if (const auto error = AssetStore(root, complaints).replaceCatalogue(options.type, contents.bytes)) {
        return fail("the catalogue is refused: " + *error,
                    "Its key has to be trusted for catalogues: typhonctl assets trust FILE.pub");
    }
    return announce(invocation, options.type, "cached-metadata-updated");
}

int trust(const Invocation& invocation, const FileOptions& options)
{
    const auto key = readPublicKeyFile(options.file);
    if (!key.value) {
        return fail(options.file + ": " + key.error);
    }
    const auto directory = invocation.root().real(catalogueKeysDirectory);
    const auto path = directory + "/" + hexOf(key.value->bytes) + ".plist";
    const auto text = encodeTrustedKey({*key.value, {}});
    auto error = makeDirectories(directory, 0755);
    if (!error) {
        error = replaceFile(path, Bytes(text.begin(), text.end()), 0644);
    }
    return error ? fail(*error, "Only root may say which keys are trusted; use sudo.") : exitSuccess;
}

template <class Options>
void declareType(CLI::App& command, Options& options)
{
    command.add_option("--type", options.type, "The type of the assets")
        ->type_name("TYPE")
        ->capture_default_str();
}

template <class Options>
void declareFile(CLI::App& command, Options& options)
{
    declareType(command, options);
    command.add_option("file", options.file, "The file")->required()->type_name("FILE");
}

void declareAsset(CLI::App& command, AssetOptions& options)
{
    declareType(command, options);
    command.add_option("asset", options.assetId, "The asset's identifier")->required()->type_name("ASSET");
}

void declareInstall(CLI::App& command, AssetOptions& options)
{
    declareAsset(command, options);
    command
        .add_option("source", options.source,
                    "A folder with the asset's files, or a tar archive of them, which may be compressed")
        ->required()
        ->type_name("SOURCE");
}

void declareMake(CLI::App& command, CatalogueOptions& options)
{
    declareType(command, options);
    command.add_option("--key", options.key, "The secret key that signs")->required()->type_name("FILE");
    command.add_option("--version", options.version, "Never less than that of the catalogue before")
        ->type_name("NUMBER")
        ->capture_default_str();
    command.add_option("--output", options.output, "Where to write it")->required()->type_name("FILE");
    command
        .add_option("folder", options.folder,
                    "A folder with a folder of files for each asset, and beside it, if the asset has "
                    "attributes, a property list of the same name")
        ->required()
        ->type_name("FOLDER");
}

}  // namespace

void addAssetsCommand(CLI::App& parser, Invocation& invocation)
{
    CLI::App& command = *parser.add_subcommand("assets", "Show and change the downloadable assets");
    command.require_subcommand(1)->fallthrough();
    addCommand<TypeOptions>(command, invocation, "list", "Show what is listed and installed", list,
                            [](CLI::App& list, TypeOptions& options) { declareType(list, options); });
    addCommand<AssetOptions>(
        command, invocation, "install",
        "Install a listed asset from a folder or an archive, if its files are those of the "
        "catalogue",
        install, declareInstall);
    addCommand<AssetOptions>(command, invocation, "purge", "Remove an installed asset", purge, declareAsset);
    addCommand<CatalogueOptions>(command, invocation, "make-catalogue",
                                 "Make and sign a catalogue of a folder of assets", makeCatalogueFile,
                                 declareMake);
    addCommand<TypeOptions>(
        command, invocation, "fetch-catalogue",
        "Fetch the catalogue of a type from its source, and make it the present one under "
        "the conditions of set-catalogue",
        fetch, [](CLI::App& fetch, TypeOptions& options) { declareType(fetch, options); });
    addCommand<FileOptions>(command, invocation, "set-catalogue",
                            "Make a file the catalogue of its type, if its signature counts and it is not "
                            "older than the present one",
                            setCatalogue, declareFile<FileOptions>);
    addCommand<FileOptions>(command, invocation, "trust", "Trust a public key to sign catalogues", trust,
                            declareFile<FileOptions>);
}

}  // namespace typhon
