// Whether to look for a packet again and again for a moment, before sleeping until one comes.
#ifndef TEE_SOCKET_PATIENCE_H_
#define TEE_SOCKET_PATIENCE_H_

#include <algorithm>
#include <chrono>
#include <cstdint>

namespace hosted_tee {

/// To sleep and be woken costs more than most commands: tens of microseconds where the processor has to be woken as
/// well. So a side that expects a packet soon watches for it, and lets others run in between. Once in vain says little:
/// a long command may stand between short ones. After the second time in a row it sleeps at once the next time, and
/// twice as often after each further one; on a single processor always. Of a process's threads at most half as many
/// watch as there are processors, and at most four: they are to leave room for those who work.
class patience {
 public:
  /// `moment` is how long to watch.
  explicit patience(std::chrono::microseconds moment) : moment_(moment) {}

  /// Whether there is ever a processor to watch with.
  [[nodiscard]] static bool is_possible();

  /// watch calls `has_come` until it answers true (then so does watch) or the moment is over.
  template <class Look>
  bool watch(Look&& has_come) {
    if (!begin()) return false;
    const watchers_place place;
    if (!place.is_taken()) return false;
    const auto end = std::chrono::steady_clock::now() + moment_;
    // The one that is waited for may need this very processor: others run soon, and rarely behind that.
    for (int looks = 1; std::chrono::steady_clock::now() < end; looks = std::min(8 * looks, 256)) {
      for (int i = 0; i < looks; ++i) {
        if (has_come()) {
          skips_ = 0;
          return true;
        }
      }
      let_others_run();
    }
    give_up();
    return false;
  }

 private:
  /// One of the places that the process's threads have for watching.
  class watchers_place {
   public:
    watchers_place();
    watchers_place(const watchers_place&) = delete;
    watchers_place& operator=(const watchers_place&) = delete;
    ~watchers_place();
    [[nodiscard]] bool is_taken() const { return is_taken_; }

   private:
    bool is_taken_;
  };

  static constexpr std::uint32_t most_skips = 128;

  [[nodiscard]] bool begin();
  void give_up();
  static void let_others_run();

  std::chrono::microseconds moment_;
  std::uint32_t skips_ = 0;  // how often to sleep at once after the next time in vain
  std::uint32_t left_ = 0;   // how often still
};

}  // namespace hosted_tee

#endif  // TEE_SOCKET_PATIENCE_H_
