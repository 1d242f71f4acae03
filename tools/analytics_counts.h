#pragma once

#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"

#include <cstdint>
#include <map>
#include <string>

namespace typhon {

/// What one application asked for since the machine was started.
struct RequestCounts {
    std::int64_t requests = 0;
    std::int64_t misses = 0;
    std::int64_t suggestions = 0;
    std::int64_t resolved = 0;
};

/// By application.
using AnalyticsCounts = std::map<std::string, RequestCounts>;

/// Counts the events of this boot: of a scratch system from its file, else from the journal, where only what
/// typhond's own unit wrote counts.
ClientResult<AnalyticsCounts> analyticsCounts(const RootDirectory& root);

/// The same from text in the journal's export format; other events and other boots are passed over.
AnalyticsCounts countsInExport(const std::string& text, const std::string& bootIdentifier);

}  // namespace typhon
