// Where a device is when nobody says.
#ifndef TEE_CLIENT_DEFAULT_FOLDER_H_
#define TEE_CLIENT_DEFAULT_FOLDER_H_

#include <filesystem>
#include <optional>

namespace hosted_tee {

/// environment_variable is the value of a variable, or null: an empty one counts as none.
[[nodiscard]] const char* environment_variable(const char* name);

/// default_state_folder is $KEYMASTER_STATE, else $XDG_STATE_HOME/keymaster, else ~/.local/state/keymaster. Nothing
/// when none of these and no home folder is known.
[[nodiscard]] std::optional<std::filesystem::path> default_state_folder();

}  // namespace hosted_tee

#endif  // TEE_CLIENT_DEFAULT_FOLDER_H_
