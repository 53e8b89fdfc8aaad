#include "tee/client/login.h"

#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "tee/client/client_failure.h"

namespace hosted_tee {
namespace {

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

login_method checked_login_method(std::uint32_t method, const void* connection_data) {
  const auto known = find_login_method(method);
  if (!known || (connection_data != nullptr) != known->group) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  return *known;
}

TEE_Identity login_identity(std::uint32_t method, const void* connection_data) {
  const login_method known = checked_login_method(method, connection_data);
  client_facts self;
  self.user = ::geteuid();
  if (known.group) self.group = chosen_group(connection_data);
  if (known.application) self.application = std::filesystem::read_symlink("/proc/self/exe").string();
  return identity_of(known, self);
}

}  // namespace hosted_tee
