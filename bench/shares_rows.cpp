// What a change of fonts costs for each client that is told of it.

#include "clients/font_change_shares.h"
#include "loaded_registry.h"
#include "platform/file_url.h"
#include "rows.h"
#include "sample_registry.h"

#include <memory>
#include <stdexcept>
#include <string>

namespace typhon::bench {

namespace {

constexpr std::size_t recipients = 1'000;

FontChangeShares::Recipient enumerating()
{
    return {.token = {}, .hasEnumeration = true, .isFontProvider = false, .identifier = std::nullopt};
}

FontChangeShares::Recipient provider()
{
    return {
        .token = {}, .hasEnumeration = false, .isFontProvider = true, .identifier = "com.example.provider0"};
}

/// A device with a registry that was read, where one of its fonts is reported as added.
class ChangedDevice {
public:
    explicit ChangedDevice(int fonts)
        : registry_(fonts), queue_(registry_.device().queues.createSerialQueue("bench")),
          fontInfo_(registry_.device().platform, registry_.registry(), *queue_,
                    {.isAuditTokenSandboxed = [](const AuditToken&) { return false; },
                     .issuedFontFilePathsForIdentifier =
                         [](const std::string&) { return std::vector<std::string>(); }})
    {}

    /// Seconds for one recipient, with the beginning of the change shared by all of them.
    Step shares(const FontChangeShares::Recipient& recipient)
    {
        return [this, recipient] {
            const auto begin = secondsNow();
            FontChangeShares shares(registry_.device().platform, fontInfo_, change_);
            for (std::size_t count = 0; count < recipients; ++count) {
                if (!shares.shareOf(recipient)) {
                    throw std::runtime_error("a client has no share in the change");
                }
            }
            return (secondsNow() - begin) / recipients;
        };
    }

private:
    LoadedRegistry registry_;
    std::shared_ptr<WorkQueue> queue_;
    PerClientFontInfo fontInfo_;
    const PropertyList change_ = PropertyList::Dictionary{
        {"urls", PropertyList::Array{fileUrlFromPath(sampleFontPath(0))}}, {"added", true}, {"kind", 0}};
};

}  // namespace

void measureShares(Report& report)
{
    Report::begin("Shares in a change");
    ChangedDevice small(100);
    ChangedDevice large(50'000);
    const Effort effort{.rounds = 30, .steps = 5, .warmUp = 10};
    const char* peer = "the same with 100 registered fonts";
    report.add({"one added font, work per enumerating client, 50,000 registered fonts", peer,
                compare(large.shares(enumerating()), small.shares(enumerating()), effort), 1.2});
    report.add({"one added font, work per font provider, 50,000 registered fonts", peer,
                compare(large.shares(provider()), small.shares(provider()), effort), 1.2});
}

}  // namespace typhon::bench
