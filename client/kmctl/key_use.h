// A sealed key in use: what begin, update and finish are told, and the streams that they work on.
#ifndef KEYMASTER_CLIENT_KMCTL_KEY_USE_H_
#define KEYMASTER_CLIENT_KMCTL_KEY_USE_H_

#include <optional>
#include <string>

#include "client/kmctl/context.h"
#include "client/kmctl/files.h"
#include "client/lib/keys.h"
#include "client/lib/operation.h"

namespace kmctl {

/// A sealed key and how it is used: what begin is told, and what update and finish are told again.
struct key_use {
  byte_view blob;
  keymaster::client::application app;
  keymaster::client::authorizations parameters;
  keymaster::client::authorizations each_step;
  std::uint64_t algorithm = 0;
};

/// make_key_use completes what the command line gave by what the key's characteristics leave no choice about. Throws
/// keymaster::client::error, and usage_error when there is a choice. `blob` must outlive the result.
[[nodiscard]] key_use make_key_use(keymaster::client::session& ta, keymaster::keymaster_purpose_t purpose,
                                   byte_view blob, const keymaster::client::application& app,
                                   const keymaster::client::authorizations& given);

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
void feed(keymaster::client::operation& op, const key_use& key, const data_stream& data, const char* label,
          const keymaster::client::byte_sink& sink);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_KEY_USE_H_
