// Client processes killed at any moment of their work.
#include <gmock/gmock.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <thread>

#include "tests/load/load_fixture.h"

namespace load {
namespace {

using namespace std::chrono_literals;
using clock = std::chrono::steady_clock;

constexpr std::uint32_t killed_in_all = 100;
constexpr std::size_t killed_at_once = 8;
constexpr std::size_t longest_life_ms = 50;

/// What the processes tell each other.
struct notices {
  std::atomic<bool> ends = false;
  std::atomic<std::uint32_t> ready = 0;
  tally of_killed, of_lasting;
};

class shared_notices {
 public:
  shared_notices()
      : place_(::mmap(nullptr, sizeof(notices), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0)) {
    if (place_ == MAP_FAILED) throw std::runtime_error("mmap failed");
    new (place_) notices;
  }
  shared_notices(const shared_notices&) = delete;
  shared_notices& operator=(const shared_notices&) = delete;
  ~shared_notices() { ::munmap(place_, sizeof(notices)); }
  [[nodiscard]] notices& operator*() const { return *static_cast<notices*>(place_); }
  [[nodiscard]] notices* operator->() const { return static_cast<notices*>(place_); }

 private:
  void* place_;
};

/// Starts a process that does `body` and nothing else. This one has no other thread at that time.
template <class Body>
pid_t start(const Body& body) {
  (void)std::fflush(nullptr);
  const pid_t pid = ::fork();
  if (pid < 0) throw std::runtime_error("fork failed");
  if (pid > 0) return pid;
  try {
    body();
  } catch (const std::exception& wrong) {
    (void)std::fprintf(stderr, "%s\n", wrong.what());
    std::_Exit(1);
  }
  std::_Exit(0);
}

int end_of(pid_t pid) {
  int ended = 0;
  while (::waitpid(pid, &ended, 0) < 0 && errno == EINTR) {
  }
  return ended;
}

bool was_killed(pid_t pid) {
  (void)::kill(pid, SIGKILL);
  const int ended = end_of(pid);
  return WIFSIGNALED(ended) && WTERMSIG(ended) == SIGKILL;
}

class KilledClientsTest : public LoadTest {
 protected:
  struct victim {
    pid_t pid;
    clock::time_point end;
  };

  /// A client that has begun to work, and the moment that it is to be killed at.
  victim next_victim(std::uint32_t number) {
    const pid_t pid = start([&] {
      ++told->ready;
      work(teed.name(), {seed_of_run(), 1000 + number}, keys, told->of_killed, [] { return true; });
    });
    EXPECT_TRUE(eventually([&] { return told->ready == number + 1; }));
    return {pid, clock::now() + std::chrono::milliseconds(below(random, longest_life_ms + 1))};
  }

  /// A client that does nothing wrong, beside those. The operations of killed clients stay until the last session ends,
  /// so it ends its own now and then: some of these times nobody else is there.
  pid_t start_lasting() {
    return start([&] {
      for (std::uint32_t round = 0; !told->ends; ++round) {
        std::size_t left = 20;
        work(teed.name(), {seed_of_run(), 2000 + round}, keys, told->of_lasting,
             [&] { return left-- > 0 && !told->ends; });
      }
    });
  }

  shared_notices told;
  std::mt19937 random{seed_of_run()};
};

TEST_F(KilledClientsTest, TheServerKeepsNothingOfThem) {
  warm_up();
  const holdings rest = at_rest();
  const hosted_tee::ta_status fresh = fresh_instance();
  const std::uint64_t accepted = teed.status().accepted;
  [[maybe_unused]] const std::size_t memory_before = teed.own_memory();
  const pid_t lasting = start_lasting();
  std::vector<victim> alive;
  for (std::uint32_t started = 0; started < killed_in_all || !alive.empty();) {
    if (started < killed_in_all && alive.size() < killed_at_once) {
      alive.push_back(next_victim(started++));
      continue;
    }
    const auto first =
        std::min_element(alive.begin(), alive.end(), [](const victim& a, const victim& b) { return a.end < b.end; });
    std::this_thread::sleep_until(first->end);
    EXPECT_TRUE(was_killed(first->pid)) << "it ended by itself, with what it printed";
    alive.erase(first);
  }
  const std::uint64_t before = told->of_lasting.all_done();
  EXPECT_TRUE(eventually([&] { return told->of_lasting.all_done() > before; })) << "it is not served any more";
  told->ends = true;
  EXPECT_EQ(end_of(lasting), 0) << "it got a wrong answer, which it printed";
  const hosted_tee::server_status end = teed.status();
  fmt::print("killed clients: {} connections, {} steps; the lasting one: {} steps\n", end.accepted - accepted,
             told->of_killed.all_done(), told->of_lasting.all_done());
  EXPECT_GT(told->of_killed.all_done(), 0U);
  EXPECT_GT(told->of_lasting.all_done(), 0U);
  EXPECT_EQ(end.dropped, 0U);
  expect_as_before(rest, fresh);
#if !SERVER_IS_SANITIZED
  // A connection's buffers alone take 192 KiB: what each of the killed had would show.
  EXPECT_LE(teed.own_memory(), memory_before + allowed_growth);
#endif
  expect_good_end();
}

}  // namespace
}  // namespace load
