#include "tee/runtime/faults.h"

#include <algorithm>
#include <utility>

namespace hosted_tee {

void fault_plan::fail_call(std::string_view name, std::uint32_t n, TEE_Result result) {
  failures_.push_back({std::string(name), n, result, {}});
}

void fault_plan::fail_any_call(std::uint32_t n, TEE_Result result) {
  failures_.push_back({{}, n, result, {}});
}

void fault_plan::fail_allocation(std::uint32_t n) {
  allocation_ = allocations_ + n;
}

void fault_plan::override_output(std::string_view name, std::uint32_t n,
                                 std::function<void(std::uint32_t* length, TEE_Result& result)> edit) {
  edits_.push_back({std::string(name), n, TEE_SUCCESS, std::move(edit)});
}

void fault_plan::observe_calls(std::function<void(std::uint32_t number, std::string_view name)> action) {
  call_action_ = std::move(action);
}

void fault_plan::at_storage_step(std::function<void(std::string_view step)> action) {
  storage_action_ = std::move(action);
}

void fault_plan::clear() {
  const bool strict = strict_gcm_tags_;  // how the platform is, not an order
  *this = fault_plan();
  strict_gcm_tags_ = strict;
}

std::uint32_t fault_plan::call_count(std::string_view name) const {
  return counts_.count(name);
}

std::optional<TEE_Result> fault_plan::ordered_failure(std::string_view name, bool is_step) {
  std::optional<TEE_Result> result;
  std::erase_if(failures_, [&](order& o) {
    const bool meant = o.name.empty() ? !is_step : o.name == name;
    if (!meant || --o.calls != 0) return false;
    result = o.result;
    return true;
  });
  if (result) triggered_ = true;
  return result;
}

std::optional<TEE_Result> fault_plan::on_call(const char* name, call_kind kind) {
  counts_.add(name);
  ++calls_;
  if (call_action_) call_action_(calls_, name);
  if (kind == call_kind::infallible) return std::nullopt;
  const bool is_step = kind == call_kind::step;
  if (is_step && std::find(steps_.begin(), steps_.end(), name) == steps_.end()) steps_.emplace_back(name);
  if (!is_step) ++fallible_calls_;
  return failures_.empty() ? std::nullopt : ordered_failure(name, is_step);
}

bool fault_plan::on_allocation() {
  if (++allocations_ != allocation_) return false;
  allocation_.reset();
  triggered_ = true;
  return true;
}

void fault_plan::on_output(const char* name, std::uint32_t* length, TEE_Result& result) {
  if (edits_.empty()) return;
  auto due = edits_.end();
  for (auto it = edits_.begin(); it != edits_.end(); ++it) {
    if (it->name == name && --it->calls == 0) due = it;
  }
  if (due == edits_.end()) return;
  const auto edit = std::move(due->edit);
  edits_.erase(due);
  triggered_ = true;
  edit(length, result);
}

void fault_plan::on_storage_step(std::string_view step) {
  if (storage_action_) storage_action_(step);
}

}  // namespace hosted_tee
