#include "client/kmctl/values.h"

#include <fmt/format.h>

#include <algorithm>
#include <charconv>
#include <chrono>

#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"

namespace kmctl {
namespace {

using namespace std::chrono;

int hex_digit(char c) {
  if (c >= '0' && c <= '9') {
    return c - '0';
  }
  const char lower = static_cast<char>(c | 0x20);
  return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

/// Reads the pieces of a date front to back. Every piece that isn't there makes the whole text no date.
class date_reader {
 public:
  explicit date_reader(std::string_view text) : text_(text), rest_(text) {}

  [[nodiscard]] bool empty() const { return rest_.empty(); }

  bool take(char c) {
    if (rest_.empty() || rest_.front() != c) {
      return false;
    }
    rest_.remove_prefix(1);
    return true;
  }

  void expect(char c) {
    if (!take(c)) {
      refuse();
    }
  }

  int number(std::size_t digits, int largest) {
    int value = 0;
    for (std::size_t i = 0; i < digits; ++i) {
      if (rest_.empty() || rest_.front() < '0' || rest_.front() > '9') {
        refuse();
      }
      value = value * 10 + (rest_.front() - '0');
      rest_.remove_prefix(1);
    }
    if (value > largest) {
      refuse();
    }
    return value;
  }

  /// The digits behind a decimal point, as milliseconds; finer ones are dropped.
  milliseconds fraction() {
    int millis = number(1, 9) * 100;
    for (int weight = 10; !rest_.empty() && rest_.front() >= '0' && rest_.front() <= '9'; weight /= 10) {
      millis += weight * number(1, 9);
    }
    return milliseconds(millis);
  }

  [[noreturn]] void refuse() const {
    throw usage_error(fmt::format("'{}' is not a date", text_),
                      "write 2030-01-31, 2030-01-31T12:00:00Z or 2030-01-31T12:00:00+02:00");
  }

 private:
  std::string_view text_;
  std::string_view rest_;
};

milliseconds read_time(date_reader& in) {
  milliseconds time = hours(in.number(2, 23));
  in.expect(':');
  time += minutes(in.number(2, 59));
  if (in.take(':')) {
    time += seconds(in.number(2, 59));
    if (in.take('.')) {
      time += in.fraction();
    }
  }
  return time;
}

minutes read_offset(date_reader& in) {
  const bool east = in.take('+');
  if (!east && !in.take('-')) {
    in.expect('Z');
    return minutes(0);
  }
  minutes offset = hours(in.number(2, 23));
  in.take(':');
  offset += minutes(in.number(2, 59));
  return east ? offset : -offset;
}

}  // namespace

bytes parse_hex(std::string_view text) {
  bytes out;
  for (std::size_t i = 0; i < text.size(); i += 2) {
    const int high = hex_digit(text[i]);
    const int low = i + 1 < text.size() ? hex_digit(text[i + 1]) : -1;
    if (high < 0 || low < 0) {
      throw usage_error(fmt::format("'{}' is not hexadecimal", text), "write pairs of hexadecimal digits: hex:00ff17");
    }
    out.push_back(static_cast<std::uint8_t>(high << 4 | low));
  }
  return out;
}

std::string to_hex(byte_view data) {
  std::string out;
  for (const std::uint8_t byte : data) {
    fmt::format_to(std::back_inserter(out), "{:02x}", byte);
  }
  return out;
}

bytes parse_bytes(const std::string& text) {
  if (text.starts_with("hex:")) {
    return parse_hex(std::string_view(text).substr(4));
  }
  if (const auto file = file_of_value(text)) {
    return read_small_file(*file, "value");
  }
  const byte_view raw = keymaster::client::as_bytes(text.starts_with("text:") ? text.c_str() + 5 : text.c_str());
  return {raw.begin(), raw.end()};
}

bool is_printable_ascii(std::string_view text) {
  return std::ranges::all_of(text, [](char c) { return c >= ' ' && c <= '~'; });
}

std::optional<std::string> file_of_value(const std::string& text) {
  return text.starts_with("@") ? std::optional(text.substr(1)) : std::nullopt;
}

date parse_date(std::string_view text) {
  date_reader in(text);
  const year y(in.number(4, 9999));
  in.expect('-');
  const month m(static_cast<unsigned>(in.number(2, 12)));
  in.expect('-');
  const year_month_day day = y / m / std::chrono::day(static_cast<unsigned>(in.number(2, 31)));
  if (!day.ok()) {
    in.refuse();
  }
  date moment = sys_days(day);
  if (!in.empty()) {
    if (!in.take('T')) {
      in.expect(' ');
    }
    moment += read_time(in);
    if (!in.empty()) {
      moment -= read_offset(in);
    }
  }
  if (!in.empty()) {
    in.refuse();
  }
  if (moment.time_since_epoch().count() < 0) {
    throw usage_error(fmt::format("'{}' lies before 1970, where a key's dates begin", text));
  }
  return moment;
}

std::string format_date(std::uint64_t millis_since_1970) {
  constexpr std::uint64_t last = 253402300799999;  // the end of the year 9999
  if (millis_since_1970 > last) {
    return fmt::format("{} ms after 1970-01-01T00:00:00Z", millis_since_1970);
  }
  const date moment{milliseconds(static_cast<std::int64_t>(millis_since_1970))};
  const auto midnight = floor<days>(moment);
  const year_month_day day(midnight);
  const hh_mm_ss time(moment - midnight);
  std::string text = fmt::format("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}", static_cast<int>(day.year()),
                                 static_cast<unsigned>(day.month()), static_cast<unsigned>(day.day()),
                                 time.hours().count(), time.minutes().count(), time.seconds().count());
  if (time.subseconds().count() != 0) {
    text += fmt::format(".{:03}", time.subseconds().count());
  }
  return text + "Z";
}

std::uint64_t parse_number(std::string_view text, std::uint64_t largest) {
  std::string_view digits = text;
  int base = 10;
  if (digits.starts_with("0x") || digits.starts_with("0X")) {
    digits.remove_prefix(2);
    base = 16;
  }
  std::uint64_t value = 0;
  const auto [end, fault] = std::from_chars(digits.data(), digits.data() + digits.size(), value, base);
  if (fault != std::errc{} || end != digits.data() + digits.size() || value > largest) {
    throw usage_error(fmt::format("'{}' is not a number from 0 to {}", text, largest));
  }
  return value;
}

std::uint32_t parse_name(keymaster::client::name_table table, std::string_view what, std::string_view text) {
  if (const auto value = keymaster::client::value_of(table, text)) {
    return *value;
  }
  throw usage_error(fmt::format("unknown {} '{}'", what, text), "choose from: " + list_names(table));
}

std::string list_names(keymaster::client::name_table table) {
  std::string out;
  for (const auto& row : table) {
    out += out.empty() ? "" : ", ";
    out += row.name;
  }
  return out;
}

std::string format_size(std::uint64_t count) {
  if (count < 1024) {
    return fmt::format("{} byte{}", count, count == 1 ? "" : "s");
  }
  if (count < std::uint64_t{1024} * 1024) {
    return fmt::format("{},{:03} bytes", count / 1000, count % 1000);
  }
  const char* const units = "MGTPE";
  double scaled = static_cast<double>(count) / (1024.0 * 1024.0);
  std::size_t unit = 0;
  for (; scaled >= 1024.0; ++unit) {
    scaled /= 1024.0;
  }
  return fmt::format("{:.1f} {}iB", scaled, units[unit]);
}

}  // namespace kmctl
