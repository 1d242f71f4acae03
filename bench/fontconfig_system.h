#pragma once

#include "platform/linux/scratch_directory.h"

#include <functional>
#include <string>
#include <vector>

namespace typhon::bench {

/// What users have today: a folder of fonts that fontconfig knows, with a configuration and a cache of its
/// own. Needs `fc-cache` (the Debian package fontconfig).
class FontconfigSystem {
public:
    /// Puts a font file of that number at `path`.
    using MakeFont = std::function<void(int index, const std::string& path)>;

    /// With that many font files.
    FontconfigSystem(int fonts, MakeFont makeFont);

    /// Puts one more font into the folder.
    void add();
    /// Seconds that `fc-cache` and then the next process's `FcInit` take.
    double secondsToNotice() const;
    /// Seconds of single calls of `FcFontMatch` for these families, in a process that has started already.
    std::vector<double> secondsOfMatches(const std::vector<std::string>& families) const;

private:
    const MakeFont makeFont_;
    ScratchDirectory folder_;
    int next_ = 0;
};

}  // namespace typhon::bench
