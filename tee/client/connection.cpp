#include "tee/client/connection.h"

#include <array>
#include <string>
#include <string_view>
#include <utility>

#include "tee/client/client_failure.h"
#include "tee/client/default_folder.h"
#include "tee/client/embedded_link.h"
#include "tee/client/remote_link.h"

namespace hosted_tee {
namespace {

constexpr std::array<std::pair<world_fault, TEEC_Result>, 6> fault_results{{
    {world_fault::busy, TEEC_ERROR_BUSY},
    {world_fault::foreign, TEEC_ERROR_BAD_PARAMETERS},
    {world_fault::newer, TEEC_ERROR_BAD_STATE},
    {world_fault::malformed, TEEC_ERROR_BAD_FORMAT},
    {world_fault::corrupt, TEEC_ERROR_SECURITY},
    {world_fault::io, TEEC_ERROR_GENERIC},
}};

// A way in by the front of its names, and how the rest of a name is followed.
struct way_in {
  std::string_view prefix;
  std::shared_ptr<tee_link> (*follow)(const std::string& rest);
};

std::shared_ptr<tee_link> embed(const std::string& folder) {
  world_options options;
  options.state = folder;
  options.kept_trace = trace_level::error;
  return std::make_shared<embedded_link>(secure_world::open_shared(options));
}

std::shared_ptr<tee_link> call_server(const std::string& path) {
  return std::make_shared<remote_link>(path);
}

constexpr std::array<way_in, 2> ways_in{{{"embedded:", embed}, {"unix:", call_server}}};

}  // namespace

std::shared_ptr<tee_link> connect(const char* name) {
  if (name == nullptr) name = environment_variable("KEYMASTER_TEE");
  if (name == nullptr) {
    const auto folder = default_state_folder();
    if (!folder) throw client_failure(TEEC_ERROR_GENERIC);
    return embed(folder->string());
  }
  const std::string_view text = name;
  for (const way_in& way : ways_in) {
    if (text.starts_with(way.prefix) && text.size() > way.prefix.size()) {
      return way.follow(std::string(text.substr(way.prefix.size())));
    }
  }
  throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
}

TEEC_Result result_of(world_fault fault) {
  for (const auto& [known, result] : fault_results) {
    if (known == fault) return result;
  }
  return TEEC_ERROR_GENERIC;
}

}  // namespace hosted_tee
