#include "tee/client/login.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "tee/client/connection.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

struct login_method {
  std::uint32_t number;
  bool user;
  bool group;
  bool application;
};

constexpr std::array<login_method, 6> methods{{
    {TEEC_LOGIN_PUBLIC, false, false, false},
    {TEEC_LOGIN_USER, true, false, false},
    {TEEC_LOGIN_GROUP, false, true, false},
    {TEEC_LOGIN_APPLICATION, false, false, true},
    {TEEC_LOGIN_USER_APPLICATION, true, false, true},
    {TEEC_LOGIN_GROUP_APPLICATION, false, true, true},
}};

bool is_member_of(gid_t group) {
  if (group == ::getegid()) return true;
  const int count = ::getgroups(0, nullptr);
  if (count <= 0) return false;
  std::vector<gid_t> groups(static_cast<std::size_t>(count));
  const int got = ::getgroups(count, groups.data());
  return got > 0 && std::find(groups.begin(), groups.begin() + got, group) != groups.begin() + got;
}

std::uint32_t chosen_group(const void* connection_data) {
  std::uint32_t group = 0;
  std::memcpy(&group, connection_data, sizeof group);
  if (!is_member_of(group)) throw client_failure(TEEC_ERROR_ACCESS_DENIED);
  return group;
}

}  // namespace

TEE_Identity login_identity(std::uint32_t method, const void* connection_data) {
  const auto* const found =
      std::find_if(methods.begin(), methods.end(), [&](const login_method& m) { return m.number == method; });
  if (found == methods.end() || (connection_data != nullptr) != found->group) {
    throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  }
  std::string name;
  if (found->user) name += "uid=" + std::to_string(::geteuid()) + ";";
  if (found->group) name += "gid=" + std::to_string(chosen_group(connection_data)) + ";";
  if (found->application) name += "application=" + std::filesystem::read_symlink("/proc/self/exe").string() + ";";
  return {method, name.empty() ? TEE_UUID{} : named_uuid(name)};
}

}  // namespace hosted_tee
