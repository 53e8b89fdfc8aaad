#include "tee/runtime/client_identity.h"

#include <algorithm>
#include <array>

#include "tee/runtime/uuid.h"
#include "tee_client_api.h"

namespace hosted_tee {
namespace {

constexpr std::array<login_method, 6> methods{{
    {TEEC_LOGIN_PUBLIC, false, false, false},
    {TEEC_LOGIN_USER, true, false, false},
    {TEEC_LOGIN_GROUP, false, true, false},
    {TEEC_LOGIN_APPLICATION, false, false, true},
    {TEEC_LOGIN_USER_APPLICATION, true, false, true},
    {TEEC_LOGIN_GROUP_APPLICATION, false, true, true},
}};

}  // namespace

std::optional<login_method> find_login_method(std::uint32_t number) {
  const auto* const found =
      std::find_if(methods.begin(), methods.end(), [&](const login_method& m) { return m.number == number; });
  if (found == methods.end()) return std::nullopt;
  return *found;
}

TEE_Identity identity_of(const login_method& method, const client_facts& client) {
  std::string name;
  if (method.user) name += "uid=" + std::to_string(client.user) + ";";
  if (method.group) name += "gid=" + std::to_string(client.group) + ";";
  if (method.application) name += "application=" + client.application + ";";
  return {method.number, name.empty() ? TEE_UUID{} : named_uuid(name)};
}

}  // namespace hosted_tee
