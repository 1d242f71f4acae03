// Downloaded fonts: bringing the registry in step with the asset store, and answering clients about it.

#include "bare_server.h"
#include "fontmanager/font_registry_client.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"
#include "small_fonts.h"

#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

namespace typhon::bench {

namespace {

constexpr int synchronisedAssets = 500;
constexpr int answeredAssets = 2'000;
constexpr std::size_t largestAnswer = std::size_t(64) << 20;
const std::string store = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/";
const std::string registeredAssets = "/var/mobile/Library/UserFonts/FontAssets/";

std::string assetName(int index)
{
    return "bench-" + std::to_string(index) + ".asset";
}

std::string storedPath(int index)
{
    return store + assetName(index) + "/AssetData/font.ttf";
}

void install(const ScratchDaemon& daemon, int index, const std::string& font)
{
    daemon.folder().writeFile(storedPath(index), font);
}

/// A system of which this program, unsigned, is an administrator, with that many assets in step.
class AssetSystem {
public:
    explicit AssetSystem(int assets)
    {
        std::filesystem::remove_all(daemon_.folder().real("/var/lib/typhon/signatures"));
        std::filesystem::create_directories(daemon_.folder().real(store));
        for (int index = 0; index < assets; ++index) {
            install(daemon_, index, test_fonts::contentsOf(test_fonts::sans));
        }
        daemon_.start();
        auto client = FontRegistryClient::connect({.root = daemon_.folder().path(), .helper = std::nullopt});
        if (!client) {
            throw std::runtime_error(client.error().message);
        }
        client_ = std::make_unique<FontRegistryClient>(std::move(*client));
        synchronize();
    }

    /// Seconds until one more asset is registered.
    double secondsForOneMore()
    {
        install(daemon_, synchronisedAssets, test_fonts::contentsOf(test_fonts::serif));
        const auto begin = secondsNow();
        synchronize();
        const auto seconds = secondsNow() - begin;
        const auto name = assetName(synchronisedAssets);
        if (!std::filesystem::exists(daemon_.folder().real(registeredAssets + name + "/font.ttf"))) {
            throw std::runtime_error("the new asset was left out");
        }
        std::filesystem::remove_all(daemon_.folder().real(store + name));
        synchronize();
        return seconds;
    }

private:
    void synchronize()
    {
        if (const auto done = client_->synchronizeFontAssets(); !done) {
            throw std::runtime_error(done.error().message);
        }
    }

    ScratchDaemon daemon_{0, {}};
    std::unique_ptr<FontRegistryClient> client_;
};

void measureOneNewAsset(Report& report)
{
    AssetSystem many(synchronisedAssets - 1);
    AssetSystem none(0);
    report.add({"synchronising 500 assets of which one is new",
                "synchronising that one alone in an empty store",
                compare([&] { return many.secondsForOneMore(); }, [&] { return none.secondsForOneMore(); },
                        {.rounds = 20, .steps = 1, .warmUp = 2}),
                3});
}

RawClient::Message assetsCall(const RawClient& client, const char* interface, const char* member,
                              int assets = answeredAssets)
{
    auto call = client.newCall(interface, member);
    sd_bus_message_open_container(call.get(), 'a', "s");
    for (int index = 0; index < assets; ++index) {
        sd_bus_message_append(call.get(), "s", storedPath(index).c_str());
    }
    sd_bus_message_close_container(call.get());
    return call;
}

/// The entries of an answer, which are too many to travel in the message itself.
PropertyList entriesIn(sd_bus_message* reply)
{
    int success = 0;
    const char* key = nullptr;
    int file = -1;
    sd_bus_message_read(reply, "b", &success);
    sd_bus_message_enter_container(reply, 'a', "a{sv}");
    sd_bus_message_enter_container(reply, 'a', "{sv}");
    while (sd_bus_message_enter_container(reply, 'e', "sv") > 0) {
        sd_bus_message_read(reply, "s", &key);
        if (std::string(key) == "fontsInfo" && sd_bus_message_read(reply, "v", "h", &file) >= 0) {
            const auto bytes = contentsOfSealedMemoryFile(file, largestAnswer);
            auto reading = readPropertyList(bytes.value());
            return reading.value.value();
        }
        sd_bus_message_skip(reply, "v");
        sd_bus_message_exit_container(reply);
    }
    throw std::runtime_error("the reply holds no entries");
}

std::size_t countOf(const PropertyList& entries)
{
    return entries.asDictionary() == nullptr ? 0 : entries.asDictionary()->size();
}

/// Reads what was asked for, and builds the same reply.
BareServer::Answer bareAnswer(const PropertyList& entries)
{
    return [entries](sd_bus_message* call) {
        std::size_t asked = 0;
        const char* path = nullptr;
        sd_bus_message_enter_container(call, 'a', "s");
        while (sd_bus_message_read(call, "s", &path) > 0) {
            ++asked;
        }
        const auto file = sealedMemoryFile(writeBinaryPropertyList(entries));
        const std::vector<std::uint8_t> token(200, 'x');
        sd_bus_message* reply = nullptr;
        sd_bus_message_new_method_return(call, &reply);
        sd_bus_message_append(reply, "b", asked == answeredAssets);
        sd_bus_message_open_container(reply, 'a', "a{sv}");
        sd_bus_message_open_container(reply, 'a', "{sv}");
        sd_bus_message_open_container(reply, 'e', "sv");
        sd_bus_message_append(reply, "s", "extension.fontasset");
        sd_bus_message_open_container(reply, 'v', "ay");
        sd_bus_message_append_array(reply, 'y', token.data(), token.size());
        sd_bus_message_close_container(reply);
        sd_bus_message_close_container(reply);
        sd_bus_message_append(reply, "{sv}", "fontsInfo", "h", reopenedReadOnly(file.get()).get());
        sd_bus_message_close_container(reply);
        sd_bus_message_close_container(reply);
        const int outcome = sd_bus_send(nullptr, reply, nullptr);
        sd_bus_message_unref(reply);
        return outcome < 0 ? outcome : 1;
    };
}

Step asking(const RawClient& client, const char* interface, const char* member)
{
    return timed([&client, interface, member] { return client.send(assetsCall(client, interface, member)); });
}

/// The daemon answers the same question again with the same value; here no question is the one before.
void measureOtherAnswers(Report& report, const RawClient& client)
{
    const auto& operation = wire::synchronizeFontAssets;
    std::vector<double> measurements;
    for (int round = 0; round < 400; ++round) {
        measurements.push_back(timed([&] {
            return client.send(
                assetsCall(client, operation.interface, operation.member, answeredAssets - round % 2));
        })());
    }
    report.addFigure("`synchronizeFontAssets:reply:` about other assets than the call before, of 2,000",
                     summaryOf(std::move(measurements)));
}

void measureAnswers(Report& report)
{
    ScratchDaemon daemon(0, {"app-usage"});
    for (int index = 0; index < answeredAssets; ++index) {
        install(daemon, index, smallFont(index));
    }
    daemon.start();
    const RawClient client(daemon.socketPath());
    const auto& operation = wire::synchronizeFontAssets;
    // The first answers have the assets registered.
    PropertyList entries;
    while (countOf(entries) != answeredAssets) {
        const auto reply = client.send(assetsCall(client, operation.interface, operation.member));
        entries = entriesIn(reply.get());
    }
    const BareServer peer(daemon.folder().real("/bare"), 1, "/", {{"assets", bareAnswer(entries)}});
    const RawClient bare(peer.path());
    report.add({"`synchronizeFontAssets:reply:` with all assets present, 2,000 assets",
                "bare sd-bus call that builds the same reply",
                compare(asking(client, operation.interface, operation.member),
                        asking(bare, bareInterface, "assets"), {.rounds = 20, .steps = 20, .warmUp = 20}),
                2});
    measureOtherAnswers(report, client);
}

}  // namespace

void measureAssets(Report& report)
{
    Report::begin("Assets that clients ask for");
    measureAnswers(report);
    Report::begin("One new asset");
    measureOneNewAsset(report);
}

}  // namespace typhon::bench
