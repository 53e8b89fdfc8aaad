// Many clients at once, none of which gets a wrong answer, and a server that keeps nothing of them.
#include <gmock/gmock.h>

#include <chrono>
#include <mutex>
#include <thread>

#include "src/params/keymaster_defs.h"
#include "tests/load/load_fixture.h"
#include "tests/support/encryption.h"

namespace load {
namespace {

using namespace std::chrono_literals;
using clock = std::chrono::steady_clock;

constexpr std::uint32_t clients = 64;
constexpr std::size_t operation_places = 16;

/// Clients that work until they are told to end.
class crowd {
 public:
  crowd(const watched_teed& teed, const key_shelf& keys) : name_(teed.name()) {
    for (std::uint32_t i = 0; i < clients; ++i) {
      threads_.emplace_back([this, i, &keys] {
        try {
          work(name_, {seed_of_run(), i}, keys, counts, [this] { return !ends_; });
        } catch (const std::exception& wrong) {
          const std::scoped_lock lock(mutex_);
          wrong_.emplace_back(wrong.what());
        }
      });
    }
  }

  crowd(const crowd&) = delete;
  crowd& operator=(const crowd&) = delete;
  ~crowd() { (void)end(); }

  /// end waits for all of them, and answers what went wrong.
  std::vector<std::string> end() {
    ends_ = true;
    for (std::thread& thread : threads_) thread.join();
    threads_.clear();
    return wrong_;
  }

  tally counts;

 private:
  std::string name_;
  std::atomic<bool> ends_ = false;
  std::mutex mutex_;
  std::vector<std::string> wrong_;
  std::vector<std::thread> threads_;
};

TEST_F(LoadTest, ManyClientsGetNoWrongAnswerAndLeaveNothing) {
  const auto time = std::chrono::milliseconds(1000 * number_from_environment("LOAD_SECONDS", LOAD_SECONDS_DEFAULT));
  (void)seed_of_run();
  warm_up();
  const holdings rest = at_rest();
  const hosted_tee::ta_status fresh = fresh_instance();
  // One session throughout: the instance that all clients share does not end between them.
  std::mt19937 random(seed_of_run());
  std::optional<mixed_client> witness(std::in_place, teed.name(), random);
  desk place{teed.name(), *witness, random, keys};
  ASSERT_TRUE(ask_soter(place));  // what a TA loads once stays in its heap
  const hosted_tee::ta_status used = teed.status().tas.at(0);

  crowd all(teed, keys);
  const auto start = clock::now();
  std::this_thread::sleep_until(start + time / 3);
  [[maybe_unused]] const std::size_t early = teed.own_memory();
  std::this_thread::sleep_until(start + time);
  [[maybe_unused]] const std::size_t late = teed.own_memory();
  EXPECT_THAT(all.end(), ::testing::IsEmpty());

  const hosted_tee::server_status end = teed.status();
  all.counts.print();
  fmt::print("{} steps, {} commands, heap peak {} of {}, own memory {} and {} KiB\n", all.counts.all_done(),
             end.commands, end.tas.at(0).heap_peak, end.tas.at(0).heap_limit, early >> 10, late >> 10);
  for (std::size_t i = 0; i < all_steps().size(); ++i) {
    EXPECT_GT(all.counts.done[i], 0U) << all_steps()[i].name;
  }
  EXPECT_EQ(end.refused, 0U);
  EXPECT_EQ(end.dropped, 0U);
  // The instance that lived through it all has what it had; its peak is another.
  EXPECT_TRUE(eventually([&] { return teed.status().connections == 2; }));
  hosted_tee::ta_status left = teed.status().tas.at(0);
  left.heap_peak = used.heap_peak;
  expect_same(left, used);
  witness.reset();
#if !SERVER_IS_SANITIZED  // what was freed stays in an address sanitizer's quarantine
  EXPECT_LT(late, early + allowed_growth);
#endif
  expect_as_before(rest, fresh);
  expect_good_end();
}

TEST_F(LoadTest, ClientsTogetherHaveSixteenOperations) {
  using namespace keymaster;
  using namespace testing_support;
  const param_list ctr = cipher(KM_MODE_CTR);
  std::vector<std::unique_ptr<ta_client>> all;
  std::vector<std::uint32_t> handles;
  for (std::size_t i = 0; i < operation_places; ++i) {
    all.push_back(std::make_unique<ta_client>(teed.name()));
    handles.push_back(all.back()->must_begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr));
  }
  ta_client one_more(teed.name());
  for (int i = 0; i < 3; ++i) {
    EXPECT_TRUE(is_full(one_more.begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr)));
    EXPECT_TRUE(is_full(
        all[0]->begin(KM_PURPOSE_VERIFY, keys.rsa[0].signing, signature(KM_DIGEST_SHA1, KM_PAD_RSA_PKCS1_1_5_SIGN))));
  }
  EXPECT_EQ(teed.status().tas.at(0).sessions, operation_places + 1);
  // Any session can use any handle.
  EXPECT_TRUE(one_more.abort(handles[7]).ok());
  EXPECT_TRUE(one_more.begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr).ok());
  EXPECT_TRUE(is_full(all[7]->begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr)));
  // Sessions go and operations stay, until the last session goes.
  all.clear();
  EXPECT_TRUE(eventually([&] { return teed.status().connections == 2; }));
  EXPECT_TRUE(is_full(one_more.begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr)));
  EXPECT_TRUE(one_more.finish(handles[0]).ok());
  EXPECT_TRUE(one_more.begin(KM_PURPOSE_ENCRYPT, keys.aes[0].blob, ctr).ok());
}

}  // namespace
}  // namespace load
