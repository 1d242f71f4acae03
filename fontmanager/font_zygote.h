#pragma once

#include "fontmanager/font_request.h"
#include "platform/linux/file_descriptor.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace typhon {

/// A running font-reading process, seen from the program that started it. One thread at a time.
class FontZygote {
public:
    /// What became of a reading.
    struct Outcome {
        FontReadingReport report;
        /// What the reader wrote; of a hostile font, anything.
        std::vector<std::uint8_t> answer;
        bool isTooLong = false;
    };

    /// Starts the program. When that fails, `problem` is set and nothing can be read.
    explicit FontZygote(const std::string& program);
    /// Ends the process and whatever it started.
    ~FontZygote();
    FontZygote(const FontZygote&) = delete;
    FontZygote& operator=(const FontZygote&) = delete;

    /// Why it cannot be used, or empty.
    const std::string& problem() const { return problem_; }

    /// Has the font at `descriptor`, open for reading only, read. Null when the process has ended, or does
    /// not answer within the time of the request and `grace`; it is of no use any more then.
    std::optional<Outcome> read(int descriptor, const FontRequest& request, std::size_t largestAnswer);

    /// How long the process itself may take over the time of a reading.
    static constexpr std::chrono::seconds grace{10};

private:
    void start(const std::string& program);
    void greet();

    std::string problem_;
    FileDescriptor control_;
    pid_t process_ = -1;
};

}  // namespace typhon
