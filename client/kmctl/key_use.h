// A sealed key in use: what begin, update and finish are told, and the streams that they work on.
#ifndef KEYMASTER_CLIENT_KMCTL_KEY_USE_H_
#define KEYMASTER_CLIENT_KMCTL_KEY_USE_H_

#include <optional>
#include <string>

#include "client/kmctl/context.h"
#include "client/kmctl/files.h"
#include "client/kmctl/user_presence.h"
#include "client/lib/keys.h"
#include "client/lib/operation.h"

namespace kmctl {

/// A sealed key and how it is used: what begin is told, and what update and finish are told again. Without a user both
/// are what stands here.
struct key_use {
  byte_view blob;
  keymaster::client::application app;
  keymaster::client::authorizations parameters;
  keymaster::client::authorizations each_step;
  std::uint64_t algorithm = 0;
  bool makes_statements = false;  ///< an attested key signs statements in place of messages
  user_presence* user = nullptr;
};

/// make_key_use completes what the command line gave by what the key's characteristics leave no choice about. Throws
/// keymaster::client::error, and usage_error when there is a choice, or `user` has nothing to do. `blob` and `user`
/// must outlive the result.
[[nodiscard]] key_use make_key_use(keymaster::client::session& ta, keymaster::keymaster_purpose_t purpose,
                                   byte_view blob, const keymaster::client::application& app,
                                   const keymaster::client::authorizations& given, user_presence* user = nullptr);

/// An operation that has begun, and what its further steps are told.
struct key_operation {
  keymaster::client::operation op;
  keymaster::client::authorizations each_step;
};

/// begin_use begins an operation with the key, and has its user prove to be there. Throws keymaster::client::error, and
/// what the user throws.
[[nodiscard]] key_operation begin_use(keymaster::client::session& ta, keymaster::keymaster_purpose_t purpose,
                                      const key_use& key);

/// parameters_json gives what the key is used with under the names of the tags ("block_mode"), and parameters_text the
/// same in a line: "gcm, 128 bits".
[[nodiscard]] json parameters_json(const key_use& key);
[[nodiscard]] std::string parameters_text(const key_use& key);

/// Data that goes through an operation: where it comes from, and how much it is if that is known.
struct data_stream {
  keymaster::client::byte_source read;
  std::optional<std::uint64_t> total;
};

/// data_of streams what a file still has. The file must outlive the stream.
[[nodiscard]] data_stream data_of(input_file& file);

/// feed puts the data through an operation up to finish, with a bar on the terminal while that lasts. Throws
/// keymaster::client::error, and failure_error when the data can't be read.
void feed(key_operation& running, const data_stream& data, const char* label, const keymaster::client::byte_sink& sink);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_KEY_USE_H_
