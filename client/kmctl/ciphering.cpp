#include "client/kmctl/ciphering.h"

#include <fmt/format.h>

#include "client/kmctl/exit_codes.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

void run(key_operation& running, const data_stream& data, byte_view associated_data, const char* label,
         const client::byte_sink& sink) {
  running.op.add_associated_data(associated_data, running.each_step);
  feed(running, data, label, sink);
  sink(running.op.finish({}, running.each_step).output);
}

}  // namespace

void encrypt_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view associated_data,
                    const std::function<void(byte_view)>& take_nonce, const client::byte_sink& sink) {
  key_operation running = begin_use(ta, keymaster::KM_PURPOSE_ENCRYPT, key);
  if (const bytes nonce = running.op.nonce(); !nonce.empty()) {
    take_nonce(nonce);
  }
  run(running, data, associated_data, "Encrypting", sink);
}

void decrypt_stream(client::session& ta, const key_use& key, const data_stream& data, byte_view associated_data,
                    const client::byte_sink& sink) {
  key_operation running = begin_use(ta, keymaster::KM_PURPOSE_DECRYPT, key);
  run(running, data, associated_data, "Decrypting", sink);
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
