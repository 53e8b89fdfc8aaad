// Keys: made or imported once, held by the caller as sealed blobs, described and exported through the TA.
#ifndef KEYMASTER_CLIENT_LIB_KEYS_H_
#define KEYMASTER_CLIENT_LIB_KEYS_H_

#include "client/lib/authorizations.h"
#include "client/lib/bytes.h"
#include "client/lib/session.h"

namespace keymaster::client {

/// A key outside the TA: sealed bytes that only the device that made them can open. The caller keeps them.
using key_blob = bytes;

/// Who uses a key. A key that was made with an application id or data opens only for the same; empty means none.
struct application {
  bytes id = {};
  bytes data = {};

  /// tags gives the authorizations that bind a key to this application, or claim it at begin.
  [[nodiscard]] authorizations tags() const;
};

/// generate_key makes a key and seals it together with `description`, which becomes its characteristics (the TA adds
/// the origin). Throws error.
[[nodiscard]] key_blob generate_key(session& ta, const authorizations& description);

struct imported_key {
  key_blob blob;
  authorizations characteristics;  ///< `description` with what the TA added: origin, and size and exponent if absent
};

/// import_key seals key material that the caller has: see key_material.h for how it is laid out. Throws error, or
/// format_error when the TA's answer is malformed.
[[nodiscard]] imported_key import_key(session& ta, const authorizations& description, byte_view material);

/// get_characteristics tells what is sealed in a blob, without the application's id and data. Throws error, or
/// format_error.
[[nodiscard]] authorizations get_characteristics(session& ta, byte_view blob, const application& app = {});

/// export_key gives the public part of a key: for RSA a SubjectPublicKeyInfo in DER, for EC the component layout of
/// key_material.h. Throws error; AES and HMAC keys have no public part.
[[nodiscard]] bytes export_key(session& ta, byte_view blob, const application& app = {});

/// delete_key and delete_all_keys ask the TA to forget. The TA keeps nothing per key, so a blob that exists elsewhere
/// still works afterwards: what ends a key is that its last blob is gone. Throw error.
void delete_key(session& ta, byte_view blob);
void delete_all_keys(session& ta);

/// sealed_size_limit bounds the size of the blob of a key with this description and, when it is imported, this much
/// material.
[[nodiscard]] std::size_t sealed_size_limit(const authorizations& description, std::size_t material_size = 0);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_KEYS_H_
