// The trace facility: keeps the latest lines of the device, and prints them where it is told to.
#ifndef TEE_RUNTIME_TRACE_LOG_H_
#define TEE_RUNTIME_TRACE_LOG_H_

#include <cstdarg>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <string>
#include <string_view>

namespace hosted_tee {

enum class trace_level { error = 1, info = 2, debug = 3 };

/// One traced line: who said it, and the text exactly as formatted (a newline of the format is kept in `text`).
struct trace_line {
  std::string prefix;
  trace_level level;
  std::string function;
  int line;
  std::string text;

  /// printable gives "PREFIX level function:line: text" and exactly one newline at the end.
  [[nodiscard]] std::string printable() const;
};

/// Holds the latest 4096 lines of the levels it keeps: all of them, unless keep_up_to says otherwise. Nothing is
/// printed by default, or to standard error up to the level that the environment variable KEYMASTER_TRACE names (error,
/// info, debug).
class trace_log {
 public:
  static constexpr std::size_t capacity = 4096;

  trace_log();
  void add(trace_line line);

  /// add_formatted is add for what a TA hands over: `format` and `arguments` as vprintf takes them.
  void add_formatted(std::string_view prefix, trace_level level, const char* function, int line, const char* format,
                     std::va_list arguments);

  /// keep_up_to drops, from now on, lines that are less urgent than `level` unless they are printed. A line that is
  /// dropped is not formatted either, which is most of what it would cost.
  void keep_up_to(trace_level level) { kept_level_ = level; }
  void clear() { lines_.clear(); }
  [[nodiscard]] const std::deque<trace_line>& lines() const { return lines_; }

  /// total is how many lines there ever were; the latest of those that are held has the number total() - 1.
  [[nodiscard]] std::uint64_t total() const { return total_; }

  /// contains tells whether a line of `level` has exactly this text (format newline included).
  [[nodiscard]] bool contains(std::string_view text, trace_level level) const;
  [[nodiscard]] std::size_t count(std::string_view text, trace_level level) const;

  /// set_sink sends every line of `up_to` or more urgent to `sink`; an empty sink stops printing.
  void set_sink(std::function<void(const trace_line&)> sink, trace_level up_to);

 private:
  [[nodiscard]] trace_line next_line();
  void keep(trace_line&& line);
  [[nodiscard]] bool is_wanted(trace_level level) const {
    return level <= kept_level_ || (sink_ && level <= sink_level_);
  }

  std::deque<trace_line> lines_;
  std::uint64_t total_ = 0;
  std::function<void(const trace_line&)> sink_;
  trace_level sink_level_ = trace_level::error;
  trace_level kept_level_ = trace_level::debug;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_TRACE_LOG_H_
