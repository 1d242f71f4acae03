#pragma once

#include "fontmanager/font_names.h"

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace typhon {

class FontZygote;

/// What reading the names of one font file may cost.
struct FontParserLimits {
    FontLimits font{};
    /// Of the reading process, in time that passes and in processor time.
    std::chrono::seconds time{5};
    /// Address space of the reading process, in bytes.
    std::uint64_t memory = 256u << 20;
    /// Files read at the same time; further readings wait.
    std::size_t processes = 4;
};

/// Reads the names in font files of any origin, each file in a process of its own that holds nothing but the
/// file: a file that crashes, hangs or takes over its reader harms no other reading and not the caller.
/// Starts nothing before the first reading. Everything may be called on any thread.
class FontParser {
public:
    /// `program` is the reading program; when it is empty, "typhon-font-parser" beside the running
    /// executable, or else in the directory for programs that programs start.
    explicit FontParser(FontParserLimits limits = {}, std::string program = {});
    /// Ends the reading processes. No reading may be under way.
    ~FontParser();
    FontParser(const FontParser&) = delete;
    FontParser& operator=(const FontParser&) = delete;

    /// The names in the font file behind `descriptor`, as `readFontNames` gives them, or an error for people,
    /// without the file's name. The descriptor stays the caller's, its offset does not matter and stays; it
    /// must allow reading. Blocks until the file is read, which the limits bound.
    FontNamesReading read(int descriptor);

private:
    std::unique_ptr<FontZygote> take();
    void giveBack(std::unique_ptr<FontZygote> zygote);

    const FontParserLimits limits_;
    const std::string program_;
    std::mutex mutex_;
    std::condition_variable returned_;
    /// Protected by the mutex.
    std::vector<std::unique_ptr<FontZygote>> idle_;
    std::size_t busy_ = 0;
};

/// The path of the program that reads fonts.
std::string fontParserProgram();

}  // namespace typhon
