#include "platform/asset_service.h"
#include "platform/linux/asset_installation.h"
#include "platform/linux/asset_store.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

const std::string type = asset_types::fonts;
const std::string storePath = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";

class AssetStoreTest : public testing::Test {
protected:
    AssetStoreTest()
    {
        trust(key, "a");
        scratch.writeFile("/source/a.ttf", "a font");
        scratch.writeFile("/source/b.ttf", "another font");
    }
    void trust(const SigningKey& trusted, const std::string& name,
               std::optional<std::vector<std::string>> types = std::nullopt)
    {
        TrustedKey entry{trusted.publicKey, {}};
        entry.scope.identifiers = std::move(types);
        scratch.writeFile(std::string(catalogueKeysDirectory) + "/" + name + ".plist",
                          encodeTrustedKey(entry));
    }
    /// A catalogue of that version with one asset "a.asset" that is the source folder, and these others.
    AssetCatalogue catalogueOf(std::int64_t version, const std::vector<std::string>& others = {})
    {
        AssetCatalogue catalogue{type, version, {}};
        catalogue.assets["a.asset"] = {{{"name", "A"}}, *digestsOfFolder(scratch.real("/source")).value};
        for (const auto& assetId : others) {
            catalogue.assets[assetId] = {};
        }
        return catalogue;
    }
    std::optional<std::string> replace(const AssetCatalogue& catalogue)
    {
        return store.replaceCatalogue(type, *makeCatalogue(key, catalogue).value);
    }
    std::optional<std::string> install() { return store.install(type, "a.asset", scratch.real("/source")); }
    std::string states()
    {
        std::string text;
        for (const auto& asset : store.assets(type).assets) {
            text += asset.assetId + ":" + std::to_string(asset.state) + " ";
        }
        return text;
    }
    static std::string reason(const std::optional<std::string>& error) { return error.value_or("none"); }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    SigningKey key = generateSigningKey();
    AssetStore store{root, log};
};

TEST_F(AssetStoreTest, AnAssetIsListedThenInstalledThenNoLongerListed)
{
    EXPECT_EQ(states(), "");
    EXPECT_EQ(replace(catalogueOf(1, {"b.asset"})), std::nullopt);
    EXPECT_EQ(states(), "a.asset:1 b.asset:1 ");
    EXPECT_EQ(install(), std::nullopt);
    EXPECT_EQ(states(), "a.asset:2 b.asset:1 ");
    AssetCatalogue without{type, 2, {}};
    EXPECT_EQ(replace(without), std::nullopt);
    EXPECT_EQ(states(), "a.asset:3 ");
    EXPECT_EQ(store.purge(type, "a.asset"), std::nullopt);
    EXPECT_EQ(states(), "");
    EXPECT_TRUE(fs::is_empty(scratch.real(storePath)) || !fs::exists(scratch.real(storePath + "a.asset")));
}

TEST_F(AssetStoreTest, AnInstalledAssetHasItsFilesAndAttributes)
{
    replace(catalogueOf(1));
    ASSERT_EQ(install(), std::nullopt);
    EXPECT_EQ(scratch.readFile(storePath + "a.asset/AssetData/a.ttf"), "a font");
    const auto assets = store.assets(type).assets;
    ASSERT_EQ(assets.size(), 1U);
    EXPECT_EQ(assets[0].attributes, (PropertyList::Dictionary{{"name", "A"}}));
}

TEST_F(AssetStoreTest, AFileThatIsNotTheListedOneIsRefusedAndWhatIsInstalledStays)
{
    replace(catalogueOf(1));
    ASSERT_EQ(install(), std::nullopt);
    scratch.writeFile("/source/b.ttf", "tampered");
    EXPECT_THAT(reason(install()), HasSubstr("b.ttf is not the file that the catalogue lists"));
    EXPECT_EQ(scratch.readFile(storePath + "a.asset/AssetData/b.ttf"), "another font");
    EXPECT_FALSE(fs::exists(scratch.real(storePath + ".installing-a.asset")));
    fs::remove(scratch.real("/source/b.ttf"));
    EXPECT_NE(install(), std::nullopt);
}

TEST_F(AssetStoreTest, AnInstalledAssetIsExchangedForItsSuccessor)
{
    replace(catalogueOf(1));
    ASSERT_EQ(install(), std::nullopt);
    scratch.writeFile("/source/a.ttf", "a better font");
    fs::remove(scratch.real("/source/b.ttf"));
    replace(catalogueOf(2));
    ASSERT_EQ(install(), std::nullopt);
    EXPECT_EQ(scratch.readFile(storePath + "a.asset/AssetData/a.ttf"), "a better font");
    EXPECT_FALSE(fs::exists(scratch.real(storePath + "a.asset/AssetData/b.ttf")));
}

TEST_F(AssetStoreTest, OnlyListedAssetsCanBeInstalled)
{
    EXPECT_THAT(reason(install()), HasSubstr("no catalogue"));
    replace(catalogueOf(1));
    EXPECT_THAT(reason(store.install(type, "../x", scratch.real("/source"))),
                HasSubstr("not in the catalogue"));
}

TEST_F(AssetStoreTest, AnOlderCatalogueIsRefused)
{
    EXPECT_EQ(replace(catalogueOf(5)), std::nullopt);
    EXPECT_EQ(replace(catalogueOf(5)), std::nullopt);
    EXPECT_THAT(reason(replace(catalogueOf(4, {"b.asset"}))), HasSubstr("older"));
    EXPECT_EQ(states(), "a.asset:1 ");
}

TEST_F(AssetStoreTest, ACatalogueOfAnotherKeyOrTypeOrTamperedWithIsRefused)
{
    EXPECT_EQ(replace(catalogueOf(1)), std::nullopt);
    const auto stranger = generateSigningKey();
    EXPECT_THAT(reason(store.replaceCatalogue(type, *makeCatalogue(stranger, catalogueOf(2)).value)),
                HasSubstr("not trusted"));
    trust(stranger, "b", std::vector<std::string>{"org.example."});
    EXPECT_THAT(reason(store.replaceCatalogue(type, *makeCatalogue(stranger, catalogueOf(2)).value)),
                HasSubstr("not trusted"));
    auto other = catalogueOf(2);
    other.assetType = asset_types::letterform;
    EXPECT_THAT(reason(replace(other)), HasSubstr("another type"));
    const auto good = *makeCatalogue(key, catalogueOf(2)).value;
    std::size_t refused = 0;
    for (std::size_t at = 0; at < good.size(); at += 7) {
        auto bad = good;
        bad[at] ^= 0x40;
        // Some bytes of the container mean nothing; whatever is accepted is what was signed.
        const auto read = decodeCatalogue(bad, {TrustedKey{key.publicKey, {}}});
        EXPECT_TRUE(!read.value || (read.value->version == 2 && read.value->assets.size() == 1 &&
                                    read.value->assets.at("a.asset").files.size() == 2))
            << at;
        refused += read.value ? 0 : 1;
    }
    EXPECT_GT(refused, good.size() / 7 / 2);
    EXPECT_NE(store.replaceCatalogue(type, {}), std::nullopt);
    EXPECT_EQ(store.catalogue(type).value->version, 1);
}

TEST_F(AssetStoreTest, WithoutACatalogueThatCountsNothingInstalledIsObsolete)
{
    replace(catalogueOf(1));
    ASSERT_EQ(install(), std::nullopt);
    fs::remove(scratch.real(std::string(catalogueKeysDirectory) + "/a.plist"));
    EXPECT_EQ(states(), "a.asset:2 ");
    fs::remove_all(scratch.real("/private/var/Cargon/AssetsV2/Catalogues"));
    EXPECT_EQ(states(), "a.asset:2 ");
}

TEST_F(AssetStoreTest, PurgingWhatIsNotThereFails)
{
    EXPECT_THAT(reason(store.purge(type, "a.asset")), HasSubstr("not installed"));
    replace(catalogueOf(1));
    ASSERT_EQ(install(), std::nullopt);
    for (const char* name : {"", "..", ".", "../Catalogues", "a.asset/AssetData", "b.asset"}) {
        EXPECT_NE(store.purge(type, name), std::nullopt) << name;
    }
    EXPECT_EQ(states(), "a.asset:2 ");
}

TEST_F(AssetStoreTest, WhatAnInterruptedInstallationOrPurgeLeftIsNoAsset)
{
    replace(catalogueOf(1));
    scratch.writeFile(storePath + ".installing-a.asset/AssetData/half.ttf", "ha");
    scratch.writeFile(storePath + ".purging-a.asset/AssetData/a.ttf", "a font");
    EXPECT_EQ(states(), "a.asset:1 ");
    ASSERT_EQ(install(), std::nullopt);
    EXPECT_EQ(states(), "a.asset:2 ");
    EXPECT_FALSE(fs::exists(scratch.real(storePath + "a.asset/AssetData/half.ttf")));
    EXPECT_EQ(store.purge(type, "a.asset"), std::nullopt);
    EXPECT_FALSE(fs::exists(scratch.real(storePath + ".purging-a.asset")));
}

}  // namespace
}  // namespace typhon
