// Signing and verifying a stream, with a bar on the terminal while it lasts.
#ifndef KEYMASTER_CLIENT_KMCTL_SIGNING_H_
#define KEYMASTER_CLIENT_KMCTL_SIGNING_H_

#include <optional>

#include "client/kmctl/files.h"
#include "client/lib/keys.h"
#include "client/lib/operation.h"

namespace kmctl {

/// A sealed key and how it is used: what begin is told, and what update and finish are told again.
struct signing_key {
  byte_view blob;
  keymaster::client::application app;
  keymaster::client::authorizations parameters;
  keymaster::client::authorizations each_step;
};

/// Data to be signed: where it comes from, and how much it is if that is known.
struct data_stream {
  keymaster::client::byte_source read;
  std::optional<std::uint64_t> total;
};

/// data_of streams what a file still has. The file must outlive the stream.
[[nodiscard]] data_stream data_of(input_file& file);

/// sign_stream signs the data. Throws keymaster::client::error, and failure_error when the data can't be read.
[[nodiscard]] bytes sign_stream(keymaster::client::session& ta, const signing_key& key, const data_stream& data);

/// verify_stream checks a signature over the data. Throws the same; the error KM_ERROR_VERIFICATION_FAILED says that
/// the signature does not belong to the data and the key.
void verify_stream(keymaster::client::session& ta, const signing_key& key, const data_stream& data,
                   byte_view signature);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_SIGNING_H_
