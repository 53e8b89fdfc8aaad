// What the hosted TEE asks of the system and of libcrypto, where it leaves no other trace. This program defines the
// functions itself, takes notes and calls the real ones.
#ifndef TESTS_TEE_HOST_SPY_H_
#define TESTS_TEE_HOST_SPY_H_

#include <sys/types.h>

#include <string>
#include <vector>

namespace hosted_tee::testing {

struct host_spy {
  std::vector<std::string> wiped;  ///< what OPENSSL_cleanse found before it wiped
  std::vector<ino_t> flushed;      ///< the files and folders that fsync was called for
  bool watching = false;

  /// times_wiped counts the wiped pieces of memory that had `secret` in them.
  [[nodiscard]] int times_wiped(const std::string& secret) const;
};
extern host_spy spy;

/// Takes notes while it lives, from an empty page.
class watch {
 public:
  watch();
  ~watch();
  watch(const watch&) = delete;
  watch& operator=(const watch&) = delete;
};

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_HOST_SPY_H_
