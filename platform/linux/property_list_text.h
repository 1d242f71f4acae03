#pragma once

#include "platform/property_list.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// Dates that both forms of a property list can carry to the second: 285 million years either way.
inline constexpr double farthestDate = 9007199254740992.0;
bool isCarried(Date date);
/// The nearest date that is carried; not a number becomes the epoch.
Date carried(Date date);

// The text of numbers and dates in the XML form. The readers ignore white space around it and give null for
// anything else than the whole of such a text.

/// Decimal or 0x hexadecimal, signed, within 64 bits.
std::optional<std::int64_t> integerFromText(std::string_view text);

/// Decimal, "inf", "infinity" or "nan"; null also for what overflows.
std::optional<double> realFromText(std::string_view text);
/// The shortest text that reads back as the same real.
std::string textFromReal(double real);

/// "2024-01-02T03:04:05Z": a real calendar date, UTC, without leap seconds. The year has a sign if it is
/// negative, and at least four digits.
std::optional<Date> dateFromText(std::string_view text);
/// Fractions of a second are dropped (towards the past), dates that are not carried moved to the nearest.
std::string textFromDate(Date date);

}  // namespace typhon
