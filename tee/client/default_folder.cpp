#include "tee/client/default_folder.h"

#include <pwd.h>
#include <unistd.h>

#include <cstdlib>

namespace hosted_tee {
namespace {

std::optional<std::filesystem::path> home_folder() {
  if (const char* home = environment_variable("HOME")) return home;
  const passwd* user = ::getpwuid(::geteuid());
  if (user == nullptr || user->pw_dir == nullptr) return std::nullopt;
  return user->pw_dir;
}

}  // namespace

const char* environment_variable(const char* name) {
  const char* const value = std::getenv(name);
  return value == nullptr || *value == '\0' ? nullptr : value;
}

std::optional<std::filesystem::path> default_state_folder() {
  if (const char* folder = environment_variable("KEYMASTER_STATE")) return folder;
  // The XDG Base Directory rules have a relative path ignored.
  const char* const states = environment_variable("XDG_STATE_HOME");
  if (states != nullptr && std::filesystem::path(states).is_absolute()) {
    return std::filesystem::path(states) / "keymaster";
  }
  const auto home = home_folder();
  if (!home) return std::nullopt;
  return *home / ".local" / "state" / "keymaster";
}

}  // namespace hosted_tee
