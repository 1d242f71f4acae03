#include "tools/date_text.h"

#include "platform/linux/property_list_text.h"

#include <cmath>

#include <fmt/format.h>

namespace typhon {

std::string dateText(Date date)
{
    // Whole microseconds first, so that a fraction that rounds up carries into the seconds.
    const double rounded = std::round(date.seconds * 1e6) / 1e6;
    const double whole = std::floor(rounded);
    auto text = textFromDate(Date{whole});
    const auto microseconds = std::lround((rounded - whole) * 1e6);
    if (microseconds != 0) {
        text.insert(text.size() - 1, fmt::format(".{:06}", microseconds));
    }
    return text;
}

}  // namespace typhon
