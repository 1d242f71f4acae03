#include "platform/linux/property_list_text.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>

namespace typhon {
namespace {

constexpr std::int64_t secondsOfDay = 86'400;
constexpr std::int64_t daysOfEra = 146'097;

std::string_view trimmed(std::string_view text)
{
    constexpr std::string_view blanks = " \t\n\r";
    const auto first = text.find_first_not_of(blanks);
    return first == text.npos ? std::string_view()
                              : text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

/// Takes a sign off the front; true for minus.
bool takeSign(std::string_view& text)
{
    const bool negative = text.starts_with('-');
    if (negative || text.starts_with('+'))
        text.remove_prefix(1);
    return negative;
}

/// All of `text` as digits.
std::optional<std::uint64_t> digits(std::string_view text, int base)
{
    std::uint64_t value = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value, base);
    if (error != std::errc() || end != text.data() + text.size())
        return std::nullopt;
    return value;
}

/// Takes `count` digits and the separator behind them.
std::optional<std::int64_t> takeField(std::string_view& text, std::size_t count, char separator)
{
    if (text.size() <= count || text[count] != separator)
        return std::nullopt;
    const auto value = digits(text.substr(0, count), 10);
    text.remove_prefix(count + 1);
    return value ? std::optional(static_cast<std::int64_t>(*value)) : std::nullopt;
}

bool isLeap(std::int64_t year)
{
    return year % 4 == 0 && (year % 100 != 0 || year % 400 == 0);
}

std::int64_t daysOfMonth(std::int64_t year, std::int64_t month)
{
    if (month == 2)
        return isLeap(year) ? 29 : 28;
    return month == 4 || month == 6 || month == 9 || month == 11 ? 30 : 31;
}

struct CivilDay {
    std::int64_t year, month, day;
};

// Both count from March, which puts the leap day last, in eras of 400 years.

std::int64_t daysSinceEpoch(CivilDay civil)
{
    const auto year = civil.month <= 2 ? civil.year - 1 : civil.year;
    const auto era = (year >= 0 ? year : year - 399) / 400;
    const auto yearOfEra = year - era * 400;
    const auto dayOfYear =
        (153 * (civil.month > 2 ? civil.month - 3 : civil.month + 9) + 2) / 5 + civil.day - 1;
    const auto dayOfEra = yearOfEra * 365 + yearOfEra / 4 - yearOfEra / 100 + dayOfYear;
    return era * daysOfEra + dayOfEra - 719'468;
}

CivilDay civilFromDays(std::int64_t days)
{
    days += 719'468;
    const auto era = (days >= 0 ? days : days - (daysOfEra - 1)) / daysOfEra;
    const auto dayOfEra = days - era * daysOfEra;
    const auto yearOfEra = (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
    const auto dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
    const auto shifted = (5 * dayOfYear + 2) / 153;
    const auto month = shifted < 10 ? shifted + 3 : shifted - 9;
    return {yearOfEra + era * 400 + (month <= 2 ? 1 : 0), month, dayOfYear - (153 * shifted + 2) / 5 + 1};
}

std::optional<std::int64_t> takeYear(std::string_view& text)
{
    constexpr std::size_t mostDigits = 9;
    const bool negative = text.starts_with('-');
    if (negative)
        text.remove_prefix(1);
    const auto count = text.find('-');
    if (count == text.npos || count < 4 || count > mostDigits)
        return std::nullopt;
    const auto year = takeField(text, count, '-');
    return year && negative ? -*year : year;
}

}  // namespace

bool isCarried(Date date)
{
    return std::abs(date.seconds) <= farthestDate;
}

Date carried(Date date)
{
    return {std::isnan(date.seconds) ? 0 : std::clamp(date.seconds, -farthestDate, farthestDate)};
}

std::optional<std::int64_t> integerFromText(std::string_view text)
{
    text = trimmed(text);
    const bool negative = takeSign(text);
    const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
    const auto magnitude = hexadecimal ? digits(text.substr(2), 16) : digits(text, 10);
    constexpr std::uint64_t largest = std::numeric_limits<std::int64_t>::max();
    if (!magnitude || *magnitude > largest + (negative ? 1 : 0))
        return std::nullopt;
    return static_cast<std::int64_t>(negative ? 0 - *magnitude : *magnitude);
}

std::optional<double> realFromText(std::string_view text)
{
    text = trimmed(text);
    if (text.starts_with('+') && !text.starts_with("+-"))
        text.remove_prefix(1);
    double real = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), real);
    if (error != std::errc() || end != text.data() + text.size())
        return std::nullopt;
    return real;
}

std::string textFromReal(double real)
{
    if (std::isnan(real))
        return "nan";
    char text[32];
    const auto written = std::to_chars(std::begin(text), std::end(text), real);
    return {text, written.ptr};
}

std::optional<Date> dateFromText(std::string_view text)
{
    text = trimmed(text);
    const auto year = takeYear(text);
    const auto month = takeField(text, 2, '-');
    const auto day = takeField(text, 2, 'T');
    const auto hour = takeField(text, 2, ':');
    const auto minute = takeField(text, 2, ':');
    const auto second = takeField(text, 2, 'Z');
    if (!year || !month || !day || !hour || !minute || !second || !text.empty())
        return std::nullopt;
    if (*month < 1 || *month > 12 || *day < 1 || *day > daysOfMonth(*year, *month))
        return std::nullopt;
    if (*hour > 23 || *minute > 59 || *second > 59)
        return std::nullopt;
    const auto days = daysSinceEpoch({*year, *month, *day});
    const Date date{static_cast<double>(days * secondsOfDay + *hour * 3600 + *minute * 60 + *second)};
    return isCarried(date) ? std::optional(date) : std::nullopt;
}

std::string textFromDate(Date date)
{
    const auto seconds = static_cast<std::int64_t>(std::floor(carried(date).seconds));
    const auto days = seconds >= 0 ? seconds / secondsOfDay : (seconds - (secondsOfDay - 1)) / secondsOfDay;
    const auto [year, month, day] = civilFromDays(days);
    const auto ofDay = seconds - days * secondsOfDay;
    char text[64];
    const int length = std::snprintf(
        text, sizeof text, "%s%04lld-%02d-%02dT%02d:%02d:%02dZ", year < 0 ? "-" : "",
        static_cast<long long>(std::abs(year)), static_cast<int>(month), static_cast<int>(day),
        static_cast<int>(ofDay / 3600), static_cast<int>(ofDay / 60 % 60), static_cast<int>(ofDay % 60));
    return {text, static_cast<std::size_t>(length)};
}

}  // namespace typhon
