// The TA's own functions called directly: an instance of the TA that is current while the test runs, without a session.
#ifndef TESTS_SUPPORT_TA_SCOPE_H_
#define TESTS_SUPPORT_TA_SCOPE_H_

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "params/key_param.h"
#include "ta/ta_limits.h"
#include "tee/runtime/accounting.h"
#include "tee/runtime/device.h"
#include "tee/runtime/instance.h"
#include "tee/runtime/instance_scope.h"
#include "tests/support/param_list.h"

namespace testing_support {

/// An instance with the TA's own UUID and heap limit on `device`, current for this thread while it lives.
class ta_scope {
 public:
  explicit ta_scope(hosted_tee::device_services& device, std::uint32_t heap_limit = keymaster::ta_heap_size);

  [[nodiscard]] hosted_tee::instance& instance() { return instance_; }
  [[nodiscard]] hosted_tee::fault_plan& faults() { return instance_.faults; }
  [[nodiscard]] hosted_tee::accounting holdings() const;

  /// The texts that were traced at a level since clear_trace, exactly as formatted and in order.
  [[nodiscard]] std::vector<std::string> traced(hosted_tee::trace_level level) const;
  [[nodiscard]] std::vector<std::string> errors() const { return traced(hosted_tee::trace_level::error); }
  void clear_trace() { instance_.device.trace.clear(); }

  /// on_free shows every heap block to `inspector` right before it is freed.
  void on_free(hosted_tee::instance_heap::inspector inspector) { instance_.heap.set_inspector(std::move(inspector)); }

 private:
  hosted_tee::instance instance_;
  hosted_tee::instance_scope scope_;
};

/// expect_same compares what an instance holds with an earlier accounting.
void expect_same(const hosted_tee::accounting& now, const hosted_tee::accounting& before);

/// Whether `needle` occurs in `haystack`; an empty needle occurs nowhere.
[[nodiscard]] bool contains(std::span<const std::uint8_t> haystack, std::span<const std::uint8_t> needle);

/// Fixture with a device that has no storage: all that parameters and authorization need. A test must give back all
/// that it took.
class TaUnitTest : public ::testing::Test {
 protected:
  void TearDown() override { expect_same(ta.holdings(), {}); }

  hosted_tee::device_services device;
  ta_scope ta{device};
};

/// in_ta builds a set on the TA's heap, with nothing but the platform's allocator.
[[nodiscard]] keymaster::parameter_set in_ta(const param_list& list);

/// from_ta reads a set back into the tests' own form.
[[nodiscard]] param_list from_ta(const keymaster::keymaster_key_param_set_t& set);

/// heap_copy puts bytes into a block of the TA's heap; never null, also for none.
[[nodiscard]] std::uint8_t* heap_copy(std::span<const std::uint8_t> data);

/// hmac_sha256 as libcrypto has it.
[[nodiscard]] bytes hmac_sha256(std::span<const std::uint8_t> key, std::span<const std::uint8_t> message);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_TA_SCOPE_H_
