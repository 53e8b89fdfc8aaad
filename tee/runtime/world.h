// The secure world as it is: sessions, instances, and the calls between them.
#ifndef TEE_RUNTIME_WORLD_H_
#define TEE_RUNTIME_WORLD_H_

#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <vector>

#include "tee/runtime/device.h"
#include "tee/runtime/heap_report.h"
#include "tee/runtime/secure_world.h"
#include "tee/runtime/state_folder.h"
#include "tee/runtime/ta_instance.h"

namespace hosted_tee {

/// Public functions take the mutex; what a TA calls (session_service) already runs under it.
class world final : public secure_world, private session_service {
 public:
  explicit world(const world_options& options);
  ~world() override;
  world(const world&) = delete;
  world& operator=(const world&) = delete;

  TEE_Result open_session(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types,
                          TEE_Param params[4], std::uint32_t& session, std::uint32_t& origin) override;
  TEE_Result invoke(std::uint32_t session, std::uint32_t command, std::uint32_t param_types, TEE_Param params[4],
                    std::uint32_t& origin) override;
  void close_session(std::uint32_t session) override;

  clocks& clock() override { return device_.clock; }
  fault_plan& faults() override { return device_.faults; }
  trace_log& trace() override { return device_.trace; }
  device_services& device() override { return device_; }
  TEE_UUID device_id() const override { return device_.id; }
  std::array<std::uint8_t, 32> boot_seed() const override { return device_.boot_seed; }
  bool has_rpmb() const override;
  accounting account(const TEE_UUID& ta) const override;
  world_status status() const override;
  std::vector<numbered_line> trace_lines(std::uint64_t from, std::size_t limit) const override;
  bool has_instance(const TEE_UUID& ta) const override;
  void set_free_inspector(std::function<void(std::span<const std::uint8_t>)> inspector) override;
  std::optional<std::string> read_object(const TEE_UUID& ta, std::uint32_t storage, std::string_view id) override;
  void write_object(const TEE_UUID& ta, std::uint32_t storage, std::string_view id, std::string_view data) override;
  void delete_object(const TEE_UUID& ta, std::uint32_t storage, std::string_view id) override;

 private:
  struct session_record {
    ta_instance* ta;  // null: its instance panicked
    void* context = nullptr;
    TEE_Identity client;
  };
  struct call;

  TEE_Result open_nested(const TEE_UUID& ta, const TEE_Identity& client, std::uint32_t param_types, TEE_Param params[4],
                         std::uint32_t& session, std::uint32_t& origin) override;
  TEE_Result invoke_nested(std::uint32_t session, std::uint32_t command, std::uint32_t param_types, TEE_Param params[4],
                           std::uint32_t& origin) override;
  void close_nested(std::uint32_t session) override;

  [[nodiscard]] std::uint32_t free_session_number();
  [[nodiscard]] TEE_Result target_for(const TEE_UUID& ta, ta_instance*& target);
  [[nodiscard]] TEE_Result start_instance(const TEE_UUID& ta, ta_instance*& target);
  [[nodiscard]] TEE_Result enter(ta_instance& ta, call& what, std::uint32_t& origin);
  [[nodiscard]] bool run(ta_instance& ta, call& what);
  void end(ta_instance& ta);
  void close_waiting();
  void trace_problem(const std::string& text);
  [[nodiscard]] object_store& storage(std::uint32_t storage) const;

  mutable std::mutex mutex_;
  state_folder folder_;
  std::optional<std::uint32_t> heap_limit_;
  device_services device_;
  heap_report heap_report_;
  instance_heap::inspector free_inspector_;
  std::vector<std::unique_ptr<ta_instance>> instances_;  // after device_: they end before it
  std::unordered_map<std::uint32_t, session_record> sessions_;
  std::vector<std::uint32_t> waiting_to_close_;  // sessions of a TA that was busy when their owner let go of them
  std::uint32_t last_session_ = 0;
  std::uint64_t commands_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_WORLD_H_
