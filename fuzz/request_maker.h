// Bodies of commands, made from a fuzzer's choices: mostly well-formed, with the values that decide something, and then
// damaged here and there.
#ifndef FUZZ_REQUEST_MAKER_H_
#define FUZZ_REQUEST_MAKER_H_

#include "fuzz/input_reader.h"

namespace fuzzing {

void append_u32(bytes& body, std::uint32_t value);
void append_u64(bytes& body, std::uint64_t value);
void append_block(bytes& body, const bytes& block);  ///< behind its length
std::uint32_t u32_at(const bytes& data, std::size_t offset);

/// Builds a marshalled parameter set.
class param_writer {
 public:
  param_writer& add(std::uint32_t tag, std::uint64_t value);
  param_writer& add_blob(std::uint32_t tag, const bytes& blob);
  [[nodiscard]] bytes marshal() const;

 private:
  std::uint32_t count_ = 0;
  bytes records_;
};

/// What the first byte of a parameter set asks for beside single parameters, whose count is in its lowest bits: digest
/// and padding of an operation, an auth token, the id and data of the application that owns the second key.
/// With `with_cipher`: block mode, padding, MAC length and nonce of a cipher or a MAC.
inline constexpr int with_scheme = 0x80, with_token = 0x40, with_application = 0x20, with_cipher = 0x10;

/// read_params makes a parameter set of known tags. `handle` is what an auth token may be bound to.
bytes read_params(input_reader& in, std::uint32_t handle);

/// read_material makes import material for an algorithm: a key's own components, some of them replaced, or raw bytes.
bytes read_material(input_reader& in, std::uint32_t algorithm);

/// damage flips, cuts or extends `body`, or leaves it alone.
void damage(input_reader& in, bytes& body);

/// limit_key_size turns down the key sizes in a marshalled set whose generation would take seconds.
void limit_key_size(bytes& marshalled);

}  // namespace fuzzing

#endif  // FUZZ_REQUEST_MAKER_H_
