#include "tee/client/default_folder.h"

#include <pwd.h>
#include <unistd.h>

#include <cstdlib>

namespace hosted_tee {
namespace {

// An empty variable counts as none.
const char* environment(const char* variable) {
  const char* value = std::getenv(variable);
  return value == nullptr || *value == '\0' ? nullptr : value;
}

std::optional<std::filesystem::path> home_folder() {
  if (const char* home = environment("HOME")) return home;
  const passwd* user = ::getpwuid(::geteuid());
  if (user == nullptr || user->pw_dir == nullptr) return std::nullopt;
  return user->pw_dir;
}

}  // namespace

std::optional<std::filesystem::path> default_state_folder() {
  if (const char* folder = environment("KEYMASTER_STATE")) return folder;
  // The XDG Base Directory rules have a relative path ignored.
  const char* const states = environment("XDG_STATE_HOME");
  if (states != nullptr && std::filesystem::path(states).is_absolute()) {
    return std::filesystem::path(states) / "keymaster";
  }
  const auto home = home_folder();
  if (!home) return std::nullopt;
  return *home / ".local" / "state" / "keymaster";
}

}  // namespace hosted_tee
