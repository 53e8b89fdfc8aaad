// What the TA's heap still held when it was freed.
#ifndef TESTS_COMMANDS_HOSTILE_FREED_MEMORY_H_
#define TESTS_COMMANDS_HOSTILE_FREED_MEMORY_H_

#include <string>

#include "tee/runtime/secure_world.h"
#include "tests/support/bytes.h"

namespace testing_support {

/// freed_memory keeps a copy of every block that is freed while it lives.
class freed_memory {
 public:
  explicit freed_memory(hosted_tee::secure_world& world);
  freed_memory(const freed_memory&) = delete;
  freed_memory& operator=(const freed_memory&) = delete;
  ~freed_memory();

  /// holds tells whether any freed block has 16 bytes in a row of `secret`. A shorter secret is looked for whole.
  [[nodiscard]] bool holds(const bytes& secret) const;

  [[nodiscard]] std::size_t blocks() const { return blocks_.size(); }
  void clear() { blocks_.clear(); }

 private:
  hosted_tee::secure_world& world_;
  std::vector<bytes> blocks_;
};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_HOSTILE_FREED_MEMORY_H_
