// How the secure world enters its TAs.
#include <algorithm>
#include <stdexcept>

#include "tee/runtime/instance_scope.h"
#include "tee/runtime/uuid.h"
#include "tee/runtime/world.h"

namespace hosted_tee {
namespace {

constexpr std::uint32_t all_types = 0xFFFF;

bool is_output(std::uint32_t type) {
  return type == TEE_PARAM_TYPE_VALUE_OUTPUT || type == TEE_PARAM_TYPE_MEMREF_OUTPUT;
}
bool is_inout(std::uint32_t type) {
  return type == TEE_PARAM_TYPE_VALUE_INOUT || type == TEE_PARAM_TYPE_MEMREF_INOUT;
}
bool is_memref(std::uint32_t type) {
  return type >= TEE_PARAM_TYPE_MEMREF_INPUT;
}

bool are_param_types(std::uint32_t types) {
  constexpr std::uint32_t highest = TEE_PARAM_TYPE_MEMREF_INOUT;
  constexpr std::uint32_t unused = 4;
  for (unsigned i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(types, i);
    if (type > highest || type == unused) return false;
  }
  return (types & ~all_types) == 0;
}

// The TA works on its own four slots: what a slot does not carry in reads as zero, and only what it carries out
// changes the caller's.
class call_params {
 public:
  call_params(std::uint32_t types, TEE_Param* callers) : types_(types), callers_(callers) {
    for (unsigned i = 0; i < 4; ++i) {
      const std::uint32_t type = TEE_PARAM_TYPE_GET(types_, i);
      if (type != TEE_PARAM_TYPE_NONE && type != TEE_PARAM_TYPE_VALUE_OUTPUT) slots_[i] = callers_[i];
    }
  }

  [[nodiscard]] TEE_Param* slots() { return slots_; }

  void hand_back() const {
    for (unsigned i = 0; i < 4; ++i) {
      const std::uint32_t type = TEE_PARAM_TYPE_GET(types_, i);
      if (!is_output(type) && !is_inout(type)) continue;
      if (is_memref(type)) {
        callers_[i].memref.size = slots_[i].memref.size;
      } else {
        callers_[i].value = slots_[i].value;
      }
    }
  }

 private:
  std::uint32_t types_;
  TEE_Param* callers_;
  TEE_Param slots_[4] = {};
};

}  // namespace

/// One call of a header record's entry, with what the landing place needs on the way back.
struct world::call {
  enum class entry { open, invoke, close } kind;
  session_record* session;
  std::uint32_t command;
  std::uint32_t types;
  TEE_Param* params;
  const tee_ta_head* head = nullptr;
  TEE_Result result = TEE_SUCCESS;

  void operator()() {
    switch (kind) {
      case entry::open:
        result = head->open_session(types, params, &session->context);
        break;
      case entry::invoke:
        result = head->invoke_command(session->context, command, types, params);
        break;
      case entry::close:
        head->close_session(session->context);
        break;
    }
  }
};

// run answers whether the instance survived.
bool world::run(ta_instance& ta, call& what) {
  const instance_scope scope(ta);
  what.head = ta.code().head;
  ta.client = what.session->client;
  ta.param_types = what.types;
  ta.params = what.params;
  ta.busy = true;
  ta.heap.begin_span();
  const auto panicked = run_guarded([](void* context) { (*static_cast<call*>(context))(); }, &what);
  ta.busy = false;
  ta.params = nullptr;
  if (what.kind == call::entry::invoke) heap_report_.note(ta.uuid, what.command, ta.heap.span_peak());
  return !panicked;
}

TEE_Result world::enter(ta_instance& ta, call& what, std::uint32_t& origin) {
  call_params params(what.types, what.params);
  what.params = params.slots();
  if (!run(ta, what)) {
    end(ta);
    origin = TEE_ORIGIN_TEE;
    return TEE_ERROR_TARGET_DEAD;
  }
  params.hand_back();
  origin = TEE_ORIGIN_TRUSTED_APP;
  if (!ta.created) end(ta);
  return what.result;
}

// end reclaims an instance that panicked or was destroyed. Its sessions are dead from here on; those that it held with
// other TAs are closed.
void world::end(ta_instance& ta) {
  for (auto& [number, record] : sessions_) {
    if (record.ta == &ta) record.ta = nullptr;
  }
  for (const auto& [handle, number] : ta.sessions) waiting_to_close_.push_back(*number);
  std::erase_if(instances_, [&](const auto& live) { return live.get() == &ta; });
}

TEE_Result world::start_instance(const TEE_UUID& ta, ta_instance*& target) {
  try {
    std::unique_ptr<ta_image> image = find_ta(ta, device_.ta_folders);
    if (image == nullptr) return TEE_ERROR_ITEM_NOT_FOUND;
    const std::uint32_t declared = image->number_property("gpd.ta.dataSize").value_or(ta_instance::default_heap);
    instances_.push_back(
        std::make_unique<ta_instance>(std::move(image), heap_limit_.value_or(declared), device_, device_.faults));
  } catch (const std::bad_alloc&) {
    return TEE_ERROR_OUT_OF_MEMORY;
  } catch (const std::runtime_error& error) {
    trace_problem("the TA " + to_text(ta) + " can't be loaded: " + error.what());
    return TEE_ERROR_BAD_FORMAT;
  }
  target = instances_.back().get();
  target->heap.set_inspector(free_inspector_);
  return TEE_SUCCESS;
}

TEE_Result world::target_for(const TEE_UUID& ta, ta_instance*& target) {
  const auto single = std::find_if(instances_.begin(), instances_.end(),
                                   [&](const auto& live) { return live->is_single() && same_uuid(live->uuid, ta); });
  if (single == instances_.end()) return start_instance(ta, target);
  target = single->get();
  return target->busy || !target->takes_another_session() ? TEE_ERROR_BUSY : TEE_SUCCESS;
}

TEE_Result world::open_nested(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                              TEE_Param params[4], std::uint32_t& session, std::uint32_t& origin) {
  session = 0;
  origin = TEE_ORIGIN_API;
  if (!are_param_types(param_types) || (param_types != 0 && params == nullptr)) return TEE_ERROR_BAD_PARAMETERS;
  origin = TEE_ORIGIN_TEE;
  ta_instance* target = nullptr;
  if (const TEE_Result result = target_for(ta, target); result != TEE_SUCCESS) return result;
  // The session has its place before the TA accepts it: afterwards nothing may fail that would leave it open for ever.
  const std::uint32_t number = free_session_number();
  session_record& record = sessions_.emplace(number, session_record{target, nullptr, client}).first->second;
  call what{call::entry::open, &record, 0, param_types, params};
  const TEE_Result result = enter(*target, what, origin);
  if (result == TEE_SUCCESS) {
    session = number;
  } else {
    sessions_.erase(number);
  }
  return result;
}

std::uint32_t world::free_session_number() {
  do {
    ++last_session_;
  } while (last_session_ == 0 || sessions_.contains(last_session_));
  return last_session_;
}

TEE_Result world::invoke_nested(std::uint32_t session, std::uint32_t command, std::uint32_t param_types,
                                TEE_Param params[4], std::uint32_t& origin) {
  origin = TEE_ORIGIN_API;
  const auto found = sessions_.find(session);
  if (found == sessions_.end() || !are_param_types(param_types) || (param_types != 0 && params == nullptr)) {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  origin = TEE_ORIGIN_TEE;
  ta_instance* ta = found->second.ta;
  if (ta == nullptr) return TEE_ERROR_TARGET_DEAD;
  if (ta->busy) return TEE_ERROR_BUSY;
  session_record record = found->second;  // a nested call may close this session
  call what{call::entry::invoke, &record, command, param_types, params};
  return enter(*ta, what, origin);
}

void world::close_nested(std::uint32_t session) {
  const auto found = sessions_.find(session);
  if (found == sessions_.end()) return;
  session_record record = found->second;
  if (record.ta != nullptr && record.ta->busy) {
    waiting_to_close_.push_back(session);
    return;
  }
  sessions_.erase(found);
  if (record.ta == nullptr) return;
  call what{call::entry::close, &record, 0, 0, nullptr};
  std::uint32_t origin = 0;
  (void)enter(*record.ta, what, origin);
}

// No TA is busy here. Closing can end a TA that holds sessions itself, so the list may grow while it is worked off.
void world::close_waiting() {
  while (!waiting_to_close_.empty()) {
    const std::uint32_t session = waiting_to_close_.back();
    waiting_to_close_.pop_back();
    close_nested(session);
  }
}

TEE_Result world::open_session(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                               TEE_Param params[4], std::uint32_t& session, std::uint32_t& origin) {
  const std::scoped_lock lock(mutex_);
  const TEE_Result result = open_nested(ta, client, param_types, params, session, origin);
  close_waiting();
  return result;
}

TEE_Result world::invoke(std::uint32_t session, std::uint32_t command, std::uint32_t param_types, TEE_Param params[4],
                         std::uint32_t& origin) {
  const std::scoped_lock lock(mutex_);
  ++commands_;
  const TEE_Result result = invoke_nested(session, command, param_types, params, origin);
  close_waiting();
  return result;
}

void world::close_session(std::uint32_t session) {
  const std::scoped_lock lock(mutex_);
  close_nested(session);
  close_waiting();
}

}  // namespace hosted_tee
