// What clients and the one who kills their server tell each other. The server lives many times; a client comes to each
// life when it begins, and leaves it when its connection has broken.
#ifndef TESTS_KILLS_KILL_STAGE_H_
#define TESTS_KILLS_KILL_STAGE_H_

#include <array>
#include <condition_variable>
#include <map>
#include <mutex>
#include <string>

#include "tests/kills/kill_place.h"

namespace hosted_tee::testing {

/// What a client is about to do, so that a kill can be aimed at it.
enum class client_step { work, open, generate, statement, use };
inline constexpr std::size_t client_steps = 5;

/// give_up ends the test program at once: something hangs, so that nothing can be joined any more.
[[noreturn]] void give_up(const std::string& what);

class kill_stage {
 public:
  explicit kill_stage(unsigned clients) : clients_(clients) {}

  // The killer's side, in this order for each life.
  void begin_life();
  /// wait_for_steps waits until `count` more steps of a kind have begun in this life. A server that ends by itself
  /// meanwhile is a failure of the test; one that takes longer than ample_time ends it.
  void wait_for_steps(client_step kind, unsigned count, const teed_process& server);
  /// rest has all clients stop between two commands, with their sessions open, until the life ends.
  void rest(const teed_process& server);
  /// doom comes before the kill: from now on calls may fail.
  void doom();
  /// end_life comes after it, and returns when all clients have seen it. A client that does not within ample_time ends
  /// the test.
  void end_life();
  /// end_all has the clients return.
  void end_all();

  // A client's side.
  /// next_life waits for the life after the one with the number `last`, and answers its number; 0: there is none any
  /// more. A client that comes late finds it over.
  [[nodiscard]] unsigned next_life(unsigned last);
  void leave();
  void begin(client_step kind);
  void rest_if_asked();
  [[nodiscard]] bool is_doomed() const;
  [[nodiscard]] bool is_over() const;  ///< whoever has not got in will not

  /// What the kills have cut off, by the name of the command.
  void note_cut(const std::string& command);
  [[nodiscard]] std::map<std::string, unsigned> cuts() const;

 private:
  template <class Condition>
  void wait_for(const char* what, const teed_process& server, Condition&& holds);

  const unsigned clients_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  unsigned life_ = 0;
  unsigned left_ = 0;
  unsigned resting_ = 0;
  bool asks_for_rest_ = false;
  bool doomed_ = false;
  bool over_ = true;
  bool ended_ = false;
  std::array<unsigned, client_steps> begun_{};
  std::map<std::string, unsigned> cuts_;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_KILLS_KILL_STAGE_H_
