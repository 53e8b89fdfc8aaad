// The byte forms that the TA speaks.
#ifndef BENCH_WIRE_H_
#define BENCH_WIRE_H_

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <utility>
#include <vector>

namespace bench {

using bytes = std::vector<std::uint8_t>;

void append_u32(bytes& body, std::uint32_t value);
void append_block(bytes& body, const bytes& block);  ///< behind its length
std::uint32_t u32_at(const bytes& data, std::size_t offset);

/// marshal gives the byte form of parameters that are numbers.
using numbers = std::initializer_list<std::pair<std::uint32_t, std::uint64_t>>;
bytes marshal(numbers params);

/// key_params asks for a key that needs no authentication, of an algorithm and a size in bits, for `more`.
bytes key_params(std::uint32_t algorithm, std::uint32_t bits, numbers more);

/// rsa_sign_key asks for a key that signs with PKCS#1 v1.5 and SHA-256; rsa_sign_params for an operation that does.
bytes rsa_sign_key(std::uint32_t bits);
bytes rsa_sign_params();

}  // namespace bench

#endif  // BENCH_WIRE_H_
