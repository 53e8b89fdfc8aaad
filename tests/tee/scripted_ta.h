// Small TAs whose entry points a test writes as lambdas.
#ifndef TESTS_TEE_SCRIPTED_TA_H_
#define TESTS_TEE_SCRIPTED_TA_H_

#include <array>
#include <functional>

#include "tee/runtime/builtin_ta.h"
#include "tee_internal_api_extensions.h"

namespace hosted_tee::testing {

/// What the entry points do. Lambdas that panic must own nothing: a panic unwinds no frame of the TA.
struct ta_script {
  std::function<TEE_Result()> create = [] { return TEE_SUCCESS; };
  std::function<void()> destroy = [] {};
  std::function<TEE_Result(std::uint32_t types, TEE_Param* params, void** context)> open =
      [](std::uint32_t, TEE_Param*, void**) { return TEE_SUCCESS; };
  std::function<void(void* context)> close = [](void*) {};
  std::function<TEE_Result(void* context, std::uint32_t command, std::uint32_t types, TEE_Param* params)> invoke =
      [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  std::uint32_t flags = TEE_TA_FLAG_SINGLE_INSTANCE | TEE_TA_FLAG_MULTI_SESSION;
  std::uint32_t keep_alive = 0;
  std::uint32_t data_size = 4096;
};

/// The N-th scripted TA; install makes `script` its behaviour in every world of this program.
template <unsigned N>
class scripted_ta {
 public:
  static constexpr TEE_UUID uuid{0x7e57a000 + N, 0x0001, 0x4000, {0x80, 0, 0, 0, 0, 0, 0, N}};

  static ta_script& install() {
    script_ = ta_script();
    register_builtin_ta({&head_, properties_.data(), prefix_.data(), create, destroy, open, close, invoke});
    return script_;
  }

  /// apply puts flags and properties of the script where the loader reads them.
  static void apply() {
    head_.flags = script_.flags;
    properties_[0].number = script_.keep_alive;
    properties_[1].number = script_.data_size;
  }

 private:
  static TEE_Result create() { return script_.create(); }
  static void destroy() { script_.destroy(); }
  static TEE_Result open(uint32_t types, TEE_Param params[4], void** context) {
    return script_.open(types, params, context);
  }
  static void close(void* context) { script_.close(context); }
  static TEE_Result invoke(void* context, uint32_t command, uint32_t types, TEE_Param params[4]) {
    return script_.invoke(context, command, types, params);
  }

  static inline ta_script script_;
  static inline tee_ta_head head_{
      uuid, 0x2000, 0, tee_entry_open_session, tee_entry_close_session, tee_entry_invoke_command};
  static inline std::array<tee_ta_property, 4> properties_{{
      {"gpd.ta.instanceKeepAlive", TEE_TA_PROPERTY_BOOL, 0, nullptr},
      {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, 0, nullptr},
      {"gpd.ta.description", TEE_TA_PROPERTY_STRING, 0, "a scripted TA"},
      {nullptr, 0, 0, nullptr},
  }};
  static constexpr std::array<char, 7> prefix_{'S', 'C', 'R', 'I', 'P', 'T', '\0'};
};

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_SCRIPTED_TA_H_
