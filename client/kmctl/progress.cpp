#include "client/kmctl/progress.h"

#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <utility>

#include "client/kmctl/console.h"
#include "client/kmctl/values.h"

namespace kmctl {
namespace {

using std::chrono::steady_clock;

constexpr auto patience = std::chrono::milliseconds(200);
constexpr auto pace = std::chrono::milliseconds(100);
constexpr const char* erase_line = "\r\x1b[K";

/// A line is short, so it is put together without the heap: a thread and a destructor must not throw.
template <class... Values>
void show(fmt::format_string<Values...> format, Values&&... values) {
  fmt::basic_memory_buffer<char, 512> line;
  fmt::format_to(std::back_inserter(line), format, std::forward<Values>(values)...);
  complain({line.data(), line.size()});
}

bool stderr_is_terminal() {
  return ::isatty(STDERR_FILENO) == 1;
}

}  // namespace

progress_bar::progress_bar(std::string label, std::optional<std::uint64_t> total)
    : label_(std::move(label)), total_(total), next_(steady_clock::now() + patience), terminal_(stderr_is_terminal()) {}

progress_bar::~progress_bar() {
  if (drawn_) {
    complain(erase_line);
  }
}

void progress_bar::advance(std::uint64_t count) {
  done_ += count;
  if (terminal_ && steady_clock::now() >= next_) {
    next_ = steady_clock::now() + pace;
    draw();
  }
}

void progress_bar::draw() {
  constexpr std::uint64_t width = 30;
  drawn_ = true;
  if (!total_ || *total_ == 0) {
    show("{}{}  {}", erase_line, label_, format_size(done_));
    return;
  }
  const double part = std::min(1.0, static_cast<double>(done_) / static_cast<double>(*total_));
  const auto filled = static_cast<std::size_t>(part * static_cast<double>(width));
  show("{}{} [{:=<{}}{: <{}}] {:3.0f} %  {}", erase_line, label_, "", filled, "", width - filled, part * 100,
       format_size(done_));
}

spinner::spinner(std::string label) : label_(std::move(label)) {
  if (stderr_is_terminal()) {
    thread_ = std::thread(&spinner::turn, this);
  }
}

spinner::~spinner() {
  {
    const std::lock_guard lock(mutex_);
    end_ = true;
  }
  ended_.notify_one();
  if (thread_.joinable()) {
    thread_.join();
  }
}

void spinner::turn() {
  constexpr std::string_view marks = "|/-\\";
  const auto start = steady_clock::now();
  bool drawn = false;
  std::unique_lock lock(mutex_);
  for (std::size_t i = 0; !ended_.wait_for(lock, drawn ? pace : patience, [this] { return end_; }); ++i) {
    const std::chrono::duration<double> passed = steady_clock::now() - start;
    show("{}{} {}  {:.1f} s", erase_line, label_, marks[i % marks.size()], passed.count());
    drawn = true;
  }
  if (drawn) {
    complain(erase_line);
  }
}

}  // namespace kmctl
