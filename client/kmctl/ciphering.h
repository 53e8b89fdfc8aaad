// Encrypting and decrypting a stream.
#ifndef KEYMASTER_CLIENT_KMCTL_CIPHERING_H_
#define KEYMASTER_CLIENT_KMCTL_CIPHERING_H_

#include <functional>
#include <string>

#include "client/kmctl/key_use.h"

namespace kmctl {

/// encrypt_stream encrypts the data and hands the ciphertext to `sink` as it comes, a GCM tag at its end.
/// `take_nonce` gets the nonce before that, where the mode has one: without it nobody can decrypt. Throws
/// keymaster::client::error, failure_error when the data can't be read, and what the two functions throw.
void encrypt_stream(keymaster::client::session& ta, const key_use& key, const data_stream& data,
                    byte_view associated_data, const std::function<void(byte_view)>& take_nonce,
                    const keymaster::client::byte_sink& sink);

/// decrypt_stream decrypts a ciphertext whose nonce is among the key's parameters. What `sink` gets of a GCM text is
/// worth nothing before this function has returned: the tag is checked last, and the error
/// KM_ERROR_VERIFICATION_FAILED says that it is wrong. Throws as encrypt_stream.
void decrypt_stream(keymaster::client::session& ta, const key_use& key, const data_stream& data,
                    byte_view associated_data, const keymaster::client::byte_sink& sink);

/// take_nonce reads the nonce that stands in front of a ciphertext, which leaves the rest in `data`. Throws
/// failure_error when the stream, called `name`, is shorter than that.
[[nodiscard]] bytes take_nonce(data_stream& data, std::size_t size, const std::string& name);

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_CIPHERING_H_
