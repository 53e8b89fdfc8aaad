#include "client/kmctl/ciphering.h"

#include <fmt/format.h>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

void run(client::operation& op, const key_use& key, const data_stream& data, byte_view associated_data,
         const char* label, const client::byte_sink& sink) {
  op.add_associated_data(associated_data, key.each_step);
  feed(op, key, data, label, sink);
  sink(op.finish({}, key.each_step).output);
}

}  // namespace

void encrypt_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view associated_data,
                    const std::function<void(byte_view)>& take_nonce, const client::byte_sink& sink) {
  auto op = client::operation::begin(ta, keymaster::KM_PURPOSE_ENCRYPT, key.blob, key.parameters, key.app);
  if (const bytes nonce = op.nonce(); !nonce.empty()) {
    take_nonce(nonce);
  }
  run(op, key, data, associated_data, "Encrypting", sink);
}

void decrypt_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view associated_data,
                    const client::byte_sink& sink) {
  auto op = client::operation::begin(ta, keymaster::KM_PURPOSE_DECRYPT, key.blob, key.parameters, key.app);
  run(op, key, data, associated_data, "Decrypting", sink);
}

bytes take_nonce(data_stream& data, std::size_t size, const std::string& name) {
  bytes nonce(size);
  if (data.read(nonce) != size) {
    throw failure_error(fmt::format("{} is too short: a nonce of {} bytes stands in front of a ciphertext",
                                    name == "-" ? "standard input" : name, size),
                        "take the whole output of kmctl encrypt; without a nonce in front, pass it with --raw --nonce");
  }
  if (data.total) {
    *data.total -= size;
  }
  return nonce;
}

}  // namespace kmctl
