#include "platform/linux/linux_asset_service.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>

#include <gtest/gtest.h>

namespace typhon {
namespace {

const std::string type = asset_types::letterform;
const std::string cataloguePath =
    "/private/var/Cargon/AssetsV2/Catalogues/com_vorlan_Cargon_LetterformAssets.plist";

class LinuxAssetServiceTest : public testing::Test {
protected:
    LinuxAssetServiceTest()
    {
        scratch.writeFile(std::string(catalogueKeysDirectory) + "/a.plist",
                          encodeTrustedKey({key.publicKey, {}}));
        AssetCatalogue catalogue{type, 1, {}};
        catalogue.assets["a.asset"] = {};
        EXPECT_EQ(store.replaceCatalogue(type, *makeCatalogue(key, catalogue).value), std::nullopt);
    }
    ~LinuxAssetServiceTest() override { pool.stop(); }

    struct Answer {
        std::int64_t result = 0;
        std::size_t count = 0;
    };
    Answer ask(std::optional<std::int64_t> types)
    {
        const auto query = service.queryWithType(type);
        if (types) {
            query->returnTypes(*types);
        }
        const auto result = query->queryMetaDataSync();
        return {result, query->results().size()};
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    EventPool pool;
    SigningKey key = generateSigningKey();
    AssetStore store{root, log};
    LinuxAssetService service{pool, log, root};
};

TEST_F(LinuxAssetServiceTest, QuestionsAboutWhatIsListedFailWhenTheCatalogueDoesNotCount)
{
    EXPECT_EQ(ask(std::nullopt).count, 1U);
    scratch.writeFile(cataloguePath, "broken");
    EXPECT_NE(ask(std::nullopt).result, 0);
    EXPECT_NE(ask(asset_return_types::listed).result, 0);
    EXPECT_EQ(ask(asset_return_types::listed).count, 0U);
    EXPECT_EQ(ask(asset_return_types::installed + asset_return_types::obsolete).result, 0);
}

TEST_F(LinuxAssetServiceTest, WithoutACatalogueNothingIsListedAndThatIsNoFailure)
{
    std::filesystem::remove(scratch.real(cataloguePath));
    EXPECT_EQ(ask(std::nullopt).result, 0);
    EXPECT_EQ(ask(std::nullopt).count, 0U);
}

}  // namespace
}  // namespace typhon
