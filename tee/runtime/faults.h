// Faults on demand: what a test orders to fail.
#ifndef TEE_RUNTIME_FAULTS_H_
#define TEE_RUNTIME_FAULTS_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tee/runtime/call_counter.h"
#include "tee_api_constants.h"

namespace hosted_tee {

/// How a platform function can fail. A step has no result to fail with: an ordered failure poisons its operation
/// (TEE_DigestUpdate, TEE_MACInit, …), or panics the instance where there is none (TEE_GenerateRandom).
enum class call_kind { fallible, step, infallible };

/// Counts the platform calls of all instances and fails the chosen ones. Counting starts at construction and at
/// clear(). A call that is made to fail has no effect but its result; output handles are set to null and output lengths
/// to 0. A test orders and asks between calls, never while another thread is in the secure world.
class fault_plan {
 public:
  /// fail_call makes the n-th call (1 = the next) of platform function `name` fail with `result`, once. Of a step the
  /// result is only the panic's code, if it panics. Infallible functions (TEE_Free, TEE_GetSystemTime, …) are counted
  /// under call_count and never fail.
  void fail_call(std::string_view name, std::uint32_t n, TEE_Result result);

  /// fail_any_call makes the n-th call (1 = the next) of all functions that return a TEE_Result fail with `result`,
  /// once. Steps do not count.
  void fail_any_call(std::uint32_t n, TEE_Result result);

  /// fail_allocation makes the n-th TEE_Malloc or TEE_Realloc (1 = the next) answer null, once.
  void fail_allocation(std::uint32_t n);

  /// override_output lets a test falsify what a call of `name` reports: `edit` runs after the n-th call (1 = the next;
  /// calls that were made to fail do not count) with the call's output length (or null where it has none) and may
  /// change it and the result, once.
  void override_output(std::string_view name, std::uint32_t n,
                       std::function<void(std::uint32_t* length, TEE_Result& result)> edit);

  /// observe_calls runs `action` before each platform call, with its number since clear() and its name. A test changes
  /// there, in the middle of a command, what the client shares with the TA. Empty: none.
  void observe_calls(std::function<void(std::uint32_t number, std::string_view name)> action);

  /// at_storage_step runs `action` before and after each step of persistent storage that could be torn by a crash; the
  /// step's name is its argument. A test kills the process there.
  void at_storage_step(std::function<void(std::string_view step)> action);

  /// strict_gcm_tags makes the platform refuse GCM tags outside 96..128 bits, as the standard's list has it.
  void strict_gcm_tags(bool on) { strict_gcm_tags_ = on; }
  [[nodiscard]] bool strict_gcm_tags() const { return strict_gcm_tags_; }

  /// clear forgets all orders and counts.
  void clear();

  [[nodiscard]] std::uint32_t call_count(std::string_view name) const;            ///< calls of one function
  [[nodiscard]] std::uint32_t fallible_calls() const { return fallible_calls_; }  ///< calls that fail_any_call counts
  [[nodiscard]] std::vector<std::string> steps() const { return steps_; }   ///< names of the steps that were called
  [[nodiscard]] std::uint32_t allocations() const { return allocations_; }  ///< what fail_allocation counts
  [[nodiscard]] bool triggered() const { return triggered_; }  ///< whether an ordered fault has happened since clear()

  // What the platform's own code asks.
  [[nodiscard]] std::optional<TEE_Result> on_call(const char* name, call_kind kind);
  [[nodiscard]] bool on_allocation();
  void on_output(const char* name, std::uint32_t* length, TEE_Result& result);
  void on_storage_step(std::string_view step);

 private:
  struct order {
    std::string name;     // empty: any call
    std::uint32_t calls;  // until it happens
    TEE_Result result;
    std::function<void(std::uint32_t*, TEE_Result&)> edit;
  };
  [[nodiscard]] std::optional<TEE_Result> ordered_failure(std::string_view name, bool is_step);

  call_counter counts_;
  std::vector<order> failures_;
  std::vector<order> edits_;
  std::optional<std::uint32_t> allocation_;  // the count at which it happens
  std::function<void(std::uint32_t, std::string_view)> call_action_;
  std::function<void(std::string_view)> storage_action_;
  std::vector<std::string> steps_;  // in the order of their first call
  std::uint32_t calls_ = 0;
  std::uint32_t fallible_calls_ = 0;
  std::uint32_t allocations_ = 0;
  bool triggered_ = false;
  bool strict_gcm_tags_ = false;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_FAULTS_H_
