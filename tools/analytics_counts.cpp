#include "tools/analytics_counts.h"

#include "platform/linux/linux_analytics.h"
#include "sdk/client_errors.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <fstream>
#include <iterator>
#include <memory>
#include <sstream>
#include <string_view>

#include <systemd/sd-journal.h>

namespace typhon {

namespace {

constexpr const char* event = "com.vorlan.font-privacy";
constexpr const char* unit = "_SYSTEMD_UNIT=typhond.service";

using Fields = std::map<std::string, std::string>;

std::int64_t numberIn(const Fields& fields, const char* name)
{
    const auto found = fields.find(name);
    std::int64_t value = 0;
    if (found != fields.end()) {
        std::from_chars(found->second.data(), found->second.data() + found->second.size(), value);
    }
    return value;
}

void count(AnalyticsCounts& counts, const Fields& fields)
{
    const auto name = fields.find("TYPHON_EVENT_NAME");
    auto& application = counts[name == fields.end() ? std::string() : name->second];
    ++application.requests;
    application.misses += numberIn(fields, "TYPHON_EVENT_MISSES");
    application.suggestions += numberIn(fields, "TYPHON_EVENT_SUGGESTIONS");
    application.resolved += numberIn(fields, "TYPHON_EVENT_RESOLVED");
}

std::string bootIdentifier()
{
    std::string identifier;
    std::ifstream("/proc/sys/kernel/random/boot_id") >> identifier;
    std::erase(identifier, '-');
    return identifier;
}

struct CloseJournal {
    void operator()(sd_journal* journal) const { sd_journal_close(journal); }
};
using Journal = std::unique_ptr<sd_journal, CloseJournal>;

Fields fieldsOfEntry(sd_journal* journal)
{
    Fields fields;
    for (const char* name :
         {"TYPHON_EVENT_NAME", "TYPHON_EVENT_MISSES", "TYPHON_EVENT_SUGGESTIONS", "TYPHON_EVENT_RESOLVED"}) {
        const void* data = nullptr;
        std::size_t length = 0;
        const auto prefix = std::string_view(name).size() + 1;
        if (sd_journal_get_data(journal, name, &data, &length) >= 0 && length >= prefix) {
            fields[name] = std::string(static_cast<const char*>(data) + prefix, length - prefix);
        }
    }
    return fields;
}

ClientResult<AnalyticsCounts> countsInJournal()
{
    sd_journal* opened = nullptr;
    const int outcome = sd_journal_open(&opened, SD_JOURNAL_LOCAL_ONLY | SD_JOURNAL_SYSTEM);
    const Journal journal(opened);
    if (outcome < 0) {
        return systemError(-outcome, "cannot read the journal");
    }
    for (const auto& match :
         {std::string("TYPHON_EVENT=") + event, "_BOOT_ID=" + bootIdentifier(), std::string(unit)}) {
        sd_journal_add_match(journal.get(), match.data(), match.size());
    }
    AnalyticsCounts counts;
    while (sd_journal_next(journal.get()) > 0) {
        count(counts, fieldsOfEntry(journal.get()));
    }
    return counts;
}

}  // namespace

AnalyticsCounts countsInExport(const std::string& text, const std::string& boot)
{
    AnalyticsCounts counts;
    Fields entry;
    std::istringstream lines(text + "\n\n");
    for (std::string line; std::getline(lines, line);) {
        if (!line.empty()) {
            const auto equals = line.find('=');
            entry.emplace(line.substr(0, equals), equals == std::string::npos ? "" : line.substr(equals + 1));
            continue;
        }
        if (entry["TYPHON_EVENT"] == event && entry["_BOOT_ID"] == boot) {
            count(counts, entry);
        }
        entry.clear();
    }
    return counts;
}

ClientResult<AnalyticsCounts> analyticsCounts(const RootDirectory& root)
{
    if (!root.isScratch()) {
        return countsInJournal();
    }
    std::ifstream file(root.real(LinuxAnalytics::eventsPath), std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return countsInExport(text, bootIdentifier());
}

}  // namespace typhon
