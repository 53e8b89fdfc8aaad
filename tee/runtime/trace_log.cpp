#include "tee/runtime/trace_log.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <utility>

namespace hosted_tee {
namespace {

constexpr std::array<std::pair<std::string_view, trace_level>, 3> level_names{
    {{"error", trace_level::error}, {"info", trace_level::info}, {"debug", trace_level::debug}}};

std::string_view name_of(trace_level level) {
  const auto* const found =
      std::find_if(level_names.begin(), level_names.end(), [&](const auto& entry) { return entry.second == level; });
  return found == level_names.end() ? "?" : found->first;
}

// One call, so that lines of several programs that share a terminal do not mix.
void print(const trace_line& line) {
  const std::string text = line.printable();
  (void)std::fwrite(text.data(), 1, text.size(), stderr);
}

void format_into(std::string& text, const char* format, std::va_list arguments) {
  std::array<char, 256> short_text;
  std::va_list again;
  va_copy(again, arguments);
  const int length = std::vsnprintf(short_text.data(), short_text.size(), format, arguments);
  if (length < 0) {
    text.assign(format);
  } else if (static_cast<std::size_t>(length) < short_text.size()) {
    text.assign(short_text.data(), static_cast<std::size_t>(length));
  } else {
    text.resize(static_cast<std::size_t>(length));
    // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): va_copy above is not seen as a start
    (void)std::vsnprintf(text.data(), text.size() + 1, format, again);
  }
  va_end(again);
}

}  // namespace

std::string trace_line::printable() const {
  std::string_view body = text;
  while (!body.empty() && body.back() == '\n') body.remove_suffix(1);
  std::string out = prefix;
  out.append(" ").append(name_of(level)).append(" ").append(function).append(":").append(std::to_string(line));
  return out.append(": ").append(body).append("\n");
}

trace_log::trace_log() {
  const char* wanted = std::getenv("KEYMASTER_TRACE");
  if (wanted == nullptr) return;
  for (const auto& [name, level] : level_names) {
    if (name == wanted) set_sink(print, level);
  }
}

// The oldest line's strings are used again: a full log costs no allocation a line.
trace_line trace_log::next_line() {
  trace_line line{};
  if (lines_.size() >= capacity) {
    line = std::move(lines_.front());
    lines_.pop_front();
  }
  return line;
}

void trace_log::keep(trace_line&& line) {
  lines_.push_back(std::move(line));
  ++total_;
  if (sink_ && lines_.back().level <= sink_level_) sink_(lines_.back());
}

void trace_log::add(trace_line line) {
  if (!is_wanted(line.level)) return;
  (void)next_line();
  keep(std::move(line));
}

void trace_log::add_formatted(std::string_view prefix, trace_level level, const char* function, int line,
                              const char* format, std::va_list arguments) {
  if (!is_wanted(level)) return;
  trace_line entry = next_line();
  entry.prefix.assign(prefix);
  entry.level = level;
  entry.function.assign(function);
  entry.line = line;
  format_into(entry.text, format, arguments);
  keep(std::move(entry));
}

bool trace_log::contains(std::string_view text, trace_level level) const {
  return count(text, level) != 0;
}

std::size_t trace_log::count(std::string_view text, trace_level level) const {
  return static_cast<std::size_t>(std::count_if(
      lines_.begin(), lines_.end(), [&](const trace_line& line) { return line.level == level && line.text == text; }));
}

void trace_log::set_sink(std::function<void(const trace_line&)> sink, trace_level up_to) {
  sink_ = std::move(sink);
  sink_level_ = up_to;
}

}  // namespace hosted_tee
