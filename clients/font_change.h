#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

/// A change of fonts as some client reported it, read once for everybody who is told of it. The report may
/// hold anything: what is missing or of another type reads as false, 0 or no URLs. Immutable: any thread.
class FontChange {
public:
    /// One font file concerned: its URL as it was reported, and the path it names.
    struct Font {
        std::string url;
        std::string path;
    };
    /// How many fonts one change may name, and the length of all their URLs, in bytes. The rest is left out.
    static constexpr std::size_t mostFonts = 65536;
    static constexpr std::size_t longestUrls = 16U << 20;

    /// `description`: "urls" (array of file URLs), "added" (boolean), "kind" (integer).
    explicit FontChange(const PropertyList& description);

    /// True for fonts that became available, false for fonts that went away.
    bool isAdded() const { return isAdded_; }
    /// True for fonts of the registry, false for fonts of profiles.
    bool isOfUserFonts() const { return isOfUserFonts_; }
    /// Those with a valid URL, in the order of the report.
    const std::vector<Font>& fonts() const { return fonts_; }
    /// How many URLs were not looked at because the change names too many.
    std::size_t leftOut() const { return leftOut_; }

private:
    void readFonts(const PropertyList::Array& urls);

    bool isAdded_ = false;
    bool isOfUserFonts_ = true;
    std::vector<Font> fonts_;
    std::size_t leftOut_ = 0;
};

}  // namespace typhon
