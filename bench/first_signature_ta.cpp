// A program that does nothing but sign once with the TA, from a sealed P-256 key.
//
// usage: first_signature_ta STATE_FOLDER BLOB >SIGNATURE
#include <cstdio>

#include "bench/bench_device.h"
#include "bench/first_signature.h"
#include "bench/p256_key.h"
#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"

int main(int argc, char** argv) {
  if (argc != 3) return 2;
  bench::bench_device device{std::filesystem::path(argv[1])};
  bench::ta_operation signing(device, {keymaster::KM_PURPOSE_SIGN, bench::read_blocks(argv[2]).at(0),
                                       bench::p256_sign_params(), bench::first_message()});
  const bench::bytes& signature = signing.run();
  return std::fwrite(signature.data(), 1, signature.size(), stdout) == signature.size() ? 0 : 1;
}
