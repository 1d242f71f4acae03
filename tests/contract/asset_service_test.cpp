#include "platform/linux/asset_store.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_asset_service.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_asset_service.h"
#include "platform/simulated/simulated_log.h"

#include <chrono>
#include <filesystem>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Attributes = PropertyList::Dictionary;
using Ids = std::vector<std::string>;

const std::string type = asset_types::fonts;

/// The asset service of one system, which knows these assets of one type.
class Subject {
public:
    virtual ~Subject() = default;
    virtual AssetService& service() = 0;
    /// An asset in that state. Before the service is asked.
    virtual void add(const std::string& assetId, std::int64_t state, Attributes attributes) = 0;
    /// From now on the catalogue cannot be fetched.
    virtual void takeSourceAway() = 0;
    /// Lets what was started go on.
    virtual void proceed() = 0;
};

class SimulatedSubject final : public Subject {
public:
    AssetService& service() override { return service_; }
    void add(const std::string& assetId, std::int64_t state, Attributes attributes) override
    {
        service_.add(type, {.assetId = assetId, .state = state, .attributes = std::move(attributes)});
    }
    void takeSourceAway() override { service_.setDownloadResult(7); }
    void proceed() override { scheduler_.runUntilIdle(); }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedAssetService service_{scheduler_};
};

/// A store on disk. No source of catalogues is configured in it.
class LinuxSubject final : public Subject {
public:
    LinuxSubject()
    {
        scratch_.writeFile(std::string(catalogueKeysDirectory) + "/a.plist",
                           encodeTrustedKey({key_.publicKey, {}}));
        std::filesystem::create_directories(scratch_.real("/empty"));
    }
    ~LinuxSubject() override { pool_.stop(); }

    AssetService& service() override { return service_; }
    void add(const std::string& assetId, std::int64_t state, Attributes attributes) override
    {
        catalogue_.assets[assetId] = {std::move(attributes), {}};
        publish();
        if (state != asset_states::listed) {
            EXPECT_EQ(store_.install(type, assetId, scratch_.real("/empty")), std::nullopt);
        }
        if (state == asset_states::obsolete) {
            catalogue_.assets.erase(assetId);
            publish();
        }
    }
    void takeSourceAway() override {}
    void proceed() override {}

private:
    void publish()
    {
        ++catalogue_.version;
        EXPECT_EQ(store_.replaceCatalogue(type, *makeCatalogue(key_, catalogue_).value), std::nullopt);
    }

    ScratchDirectory scratch_;
    RootDirectory root_{scratch_.path()};
    SimulatedLog log_;
    EventPool pool_;
    SigningKey key_ = generateSigningKey();
    AssetCatalogue catalogue_{type, 0, {}};
    AssetStore store_{root_, log_};
    LinuxAssetService service_{pool_, log_, root_};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class AssetServiceContract : public testing::TestWithParam<Implementation> {
protected:
    using Assets = std::vector<std::shared_ptr<KGAsset>>;

    std::shared_ptr<KGAssetQuery> query() { return subject->service().queryWithType(type); }
    /// Fails when the completion does not come; one that came twice would throw.
    std::int64_t completed(const std::function<void(std::function<void(std::int64_t)>)>& start)
    {
        std::promise<std::int64_t> promise;
        start([&](std::int64_t result) { promise.set_value(result); });
        subject->proceed();
        auto result = promise.get_future();
        const bool isThere = result.wait_for(std::chrono::seconds(60)) == std::future_status::ready;
        EXPECT_TRUE(isThere);
        return isThere ? result.get() : -1;
    }
    std::int64_t run(KGAssetQuery& query)
    {
        return completed([&](auto completion) { query.queryMetaData(std::move(completion)); });
    }
    Ids found(KGAssetQuery& query)
    {
        EXPECT_EQ(run(query), 0);
        Ids ids;
        for (const auto& asset : query.results()) {
            ids.push_back(asset->assetId());
        }
        return ids;
    }
    Ids foundUnder(std::int64_t types)
    {
        const auto asked = query();
        asked->returnTypes(types);
        return found(*asked);
    }
    std::shared_ptr<KGAsset> asset(const std::string& assetId)
    {
        const auto asked = query();
        run(*asked);
        for (const auto& asset : asked->results()) {
            if (asset->assetId() == assetId) {
                return asset;
            }
        }
        return nullptr;
    }
    void addOneOfEach()
    {
        subject->add("a.asset", asset_states::listed, {{"kind", "serif"}});
        subject->add("b.asset", asset_states::installed, {{"kind", "serif"}, {"size", 12}});
        subject->add("c.asset", asset_states::obsolete, {{"kind", "sans"}});
    }

    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(AssetServiceContract, WithoutAssetsAQuerySucceedsAndFindsNothing)
{
    const auto asked = query();
    EXPECT_TRUE(asked->results().empty());
    EXPECT_EQ(found(*asked), Ids{});
    EXPECT_EQ(query()->queryMetaDataSync(), 0);
}

TEST_P(AssetServiceContract, AQueryFindsTheAssetsOfItsTypeWithStateAndAttributes)
{
    addOneOfEach();
    const auto asked = query();
    EXPECT_EQ(found(*asked), (Ids{"a.asset", "b.asset", "c.asset"}));
    const auto results = asked->results();
    EXPECT_EQ(results[0]->state(), asset_states::listed);
    EXPECT_EQ(results[1]->state(), asset_states::installed);
    EXPECT_EQ(results[2]->state(), asset_states::obsolete);
    EXPECT_EQ(results[1]->attributes(), PropertyList(Attributes{{"kind", "serif"}, {"size", 12}}));
    EXPECT_EQ(found(*subject->service().queryWithType(asset_types::letterform)), Ids{});
}

TEST_P(AssetServiceContract, ReturnTypesAreASetOfWhatIsListedInstalledAndNoLongerListed)
{
    addOneOfEach();
    EXPECT_EQ(foundUnder(asset_return_types::listed), (Ids{"a.asset", "b.asset"}));
    EXPECT_EQ(foundUnder(asset_return_types::installed), Ids{"b.asset"});
    EXPECT_EQ(foundUnder(asset_return_types::obsolete), Ids{"c.asset"});
    EXPECT_EQ(foundUnder(asset_return_types::installed + asset_return_types::obsolete),
              (Ids{"b.asset", "c.asset"}));
    EXPECT_EQ(foundUnder(0), Ids{});
}

TEST_P(AssetServiceContract, AllKeysHaveToMatch)
{
    addOneOfEach();
    const auto bySerif = query();
    bySerif->addKeyValuePair("kind", "serif");
    EXPECT_EQ(found(*bySerif), (Ids{"a.asset", "b.asset"}));
    const auto bySize = query();
    bySize->addKeyValuePair("kind", "serif");
    bySize->addKeyValuePair("size", 12);
    EXPECT_EQ(found(*bySize), Ids{"b.asset"});
    const auto byText = query();
    byText->addKeyValuePair("size", "12");
    EXPECT_EQ(found(*byText), Ids{}) << "a text is no number";
    const auto byAbsence = query();
    byAbsence->addKeyValuePair("colour", "blue");
    EXPECT_EQ(found(*byAbsence), Ids{});
}

TEST_P(AssetServiceContract, ABlockingQueryHasItsResultsWhenItReturns)
{
    addOneOfEach();
    const auto asked = query();
    asked->setDoNotBlockBeforeFirstUnlock(true);
    asked->setDoNotBlockOnNetworkStatus(true);
    asked->returnTypes(asset_return_types::listed);
    EXPECT_EQ(asked->queryMetaDataSync(), 0);
    EXPECT_EQ(asked->results().size(), 2U);
}

TEST_P(AssetServiceContract, AQueryThatNobodyHoldsStillCompletes)
{
    addOneOfEach();
    EXPECT_EQ(completed([&](auto completion) { query()->queryMetaData(std::move(completion)); }), 0);
}

TEST_P(AssetServiceContract, WhatWasPurgedIsNotInstalledAnyMore)
{
    addOneOfEach();
    const auto purge = [&](const std::string& assetId) {
        const auto found = asset(assetId);
        return completed([&](auto completion) { found->purge(std::move(completion)); });
    };
    EXPECT_EQ(purge("b.asset"), 0);
    EXPECT_EQ(purge("c.asset"), 0);
    EXPECT_EQ(asset("b.asset")->state(), asset_states::listed) << "as the catalogue still lists it";
    EXPECT_EQ(asset("c.asset"), nullptr);
}

TEST_P(AssetServiceContract, APurgeThatSucceedsHasNoErrorAndOneThatFailsHas)
{
    addOneOfEach();
    const auto installed = asset("b.asset");
    const auto listed = asset("a.asset");
    std::optional<std::string> error = "not called";
    EXPECT_EQ(completed([&](auto completion) {
                  installed->purgeWithError(
                      [&, completion = std::move(completion)](auto result, const auto& why) {
                          error = why;
                          completion(result);
                      });
              }),
              0);
    EXPECT_EQ(error, std::nullopt);
    EXPECT_NE(completed([&](auto completion) {
                  listed->purgeWithError(
                      [&, completion = std::move(completion)](auto result, const auto& why) {
                          error = why;
                          completion(result);
                      });
              }),
              0);
    EXPECT_NE(error, std::nullopt) << "there are no files of an asset that is only listed";
}

TEST_P(AssetServiceContract, ACompletionMayBeLeftOut)
{
    addOneOfEach();
    const auto obsolete = asset("c.asset");
    const auto installed = asset("b.asset");
    query()->queryMetaData({});
    obsolete->purge({});
    installed->purgeWithError({});
    subject->service().startCatalogDownload(type, {}, {});
    subject->proceed();
    EXPECT_EQ(completed([&](auto completion) { query()->queryMetaData(std::move(completion)); }), 0);
}

TEST_P(AssetServiceContract, ADownloadThatFailsSaysSoAndLeavesTheCatalogue)
{
    addOneOfEach();
    subject->takeSourceAway();
    KGDownloadOptions options;
    options.setDiscretionary(true);
    EXPECT_NE(completed([&](auto completion) {
                  subject->service().startCatalogDownload(type, options, std::move(completion));
              }),
              0);
    EXPECT_EQ(foundUnder(asset_return_types::listed), (Ids{"a.asset", "b.asset"}));
}

INSTANTIATE_TEST_SUITE_P(, AssetServiceContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
