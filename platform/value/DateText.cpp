#include "platform/value/DateText.h"

#include <fmt/format.h>

#include <chrono>

namespace platform {
namespace {

// 0000-01-01T00:00:00Z and 9999-12-31T23:59:59Z.
constexpr std::int64_t kFirst = -62'167'219'200;
constexpr std::int64_t kLast = 253'402'300'799;

std::string secondsText(std::int64_t seconds) {
  const std::chrono::sys_seconds moment{std::chrono::seconds(seconds)};
  const auto midnight = std::chrono::floor<std::chrono::days>(moment);
  const std::chrono::year_month_day day(midnight);
  const std::chrono::hh_mm_ss time(moment - midnight);
  return fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}", static_cast<int>(day.year()),
                     static_cast<unsigned>(day.month()), static_cast<unsigned>(day.day()), time.hours().count(),
                     time.minutes().count(), time.seconds().count());
}

}  // namespace

std::optional<std::string> dateText(const Date& date) {
  if (date.seconds < kFirst || date.seconds > kLast) return std::nullopt;
  return secondsText(date.seconds) + 'Z';
}

std::optional<Date> parseDateText(std::string_view text) {
  constexpr std::string_view form = "0000-00-00T00:00:00Z";
  if (text.size() != form.size()) return std::nullopt;
  for (std::size_t i = 0; i < form.size(); ++i) {
    const bool fits = form[i] == '0' ? text[i] >= '0' && text[i] <= '9' : text[i] == form[i];
    if (!fits) return std::nullopt;
  }
  const auto number = [&](std::size_t at, std::size_t length) {
    int value = 0;
    for (const char c : text.substr(at, length)) value = value * 10 + (c - '0');
    return value;
  };
  const std::chrono::year_month_day day(std::chrono::year(number(0, 4)),
                                        std::chrono::month(static_cast<unsigned>(number(5, 2))),
                                        std::chrono::day(static_cast<unsigned>(number(8, 2))));
  const int hour = number(11, 2);
  const int minute = number(14, 2);
  const int second = number(17, 2);
  if (!day.ok() || hour > 23 || minute > 59 || second > 59) return std::nullopt;
  const std::int64_t days = std::chrono::sys_days(day).time_since_epoch().count();
  return Date{days * 86'400 + hour * 3'600 + minute * 60 + second, 0};
}

std::string describeDate(const Date& date) {
  if (date.seconds < kFirst || date.seconds > kLast) return fmt::format("<{} seconds since 1970>", date.seconds);
  if (date.nanoseconds == 0) return secondsText(date.seconds) + 'Z';
  std::string fraction = fmt::format("{:09}", date.nanoseconds);
  fraction.erase(fraction.find_last_not_of('0') + 1);
  return fmt::format("{}.{}Z", secondsText(date.seconds), fraction);
}

}  // namespace platform
