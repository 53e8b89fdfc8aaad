#include "tee/client/connection.h"

#include <array>
#include <cstdlib>
#include <string_view>
#include <utility>

#include "tee/client/default_folder.h"

namespace hosted_tee {
namespace {

constexpr std::string_view embedded = "embedded:";

constexpr std::array<std::pair<world_fault, TEEC_Result>, 6> fault_results{{
    {world_fault::busy, TEEC_ERROR_BUSY},
    {world_fault::foreign, TEEC_ERROR_BAD_PARAMETERS},
    {world_fault::newer, TEEC_ERROR_BAD_STATE},
    {world_fault::malformed, TEEC_ERROR_BAD_FORMAT},
    {world_fault::corrupt, TEEC_ERROR_SECURITY},
    {world_fault::io, TEEC_ERROR_GENERIC},
}};

// An empty variable counts as none.
const char* environment(const char* variable) {
  const char* value = std::getenv(variable);
  return value == nullptr || *value == '\0' ? nullptr : value;
}

std::filesystem::path state_folder_of(const char* name) {
  if (name == nullptr) name = environment("KEYMASTER_TEE");
  if (name == nullptr) {
    const auto folder = default_state_folder();
    if (!folder) throw client_failure(TEEC_ERROR_GENERIC);
    return *folder;
  }
  const std::string_view text = name;
  if (!text.starts_with(embedded) || text.size() == embedded.size()) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return text.substr(embedded.size());
}

}  // namespace

std::shared_ptr<secure_world> connect(const char* name) {
  world_options options;
  options.state = state_folder_of(name);
  options.kept_trace = trace_level::error;
  return secure_world::open_shared(options);
}

TEEC_Result result_of(world_fault fault) {
  for (const auto& [known, result] : fault_results) {
    if (known == fault) return result;
  }
  return TEEC_ERROR_GENERIC;
}

}  // namespace hosted_tee
