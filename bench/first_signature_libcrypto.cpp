// A program that does nothing but sign once with libcrypto, from the raw parts of a P-256 key.
//
// usage: first_signature_libcrypto PARTS >SIGNATURE
#include <cstdio>

#include "bench/first_signature.h"
#include "bench/p256_key.h"

int main(int argc, char** argv) {
  if (argc != 2) return 2;
  const std::vector<bench::bytes> parts = bench::read_blocks(argv[1]);
  bench::libcrypto_p256_signer signer({parts.at(0), parts.at(1)}, bench::first_message());
  const bench::bytes& signature = signer.sign();
  return std::fwrite(signature.data(), 1, signature.size(), stdout) == signature.size() ? 0 : 1;
}
