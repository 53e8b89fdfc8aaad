// A device under the soter fuzzer: a provisioning TA that the fuzzer plays, and keys with each kind of signer.
#ifndef FUZZ_SOTER_DEVICE_H_
#define FUZZ_SOTER_DEVICE_H_

#include <array>
#include <optional>

#include "fuzz/fuzz_device.h"
#include "fuzz/request_maker.h"
#include "fuzz/soter_statements.h"
#include "fuzz/soter_steps.h"
#include "tests/support/played_quil.h"

namespace fuzzing {

struct soter_blob {
  bytes blob;
  bool counted, has_uid;
  bool signed_by_attk, signed_by_key;
};

struct soter_device {
  static constexpr std::uint32_t uid = 10012;
  static constexpr const char* cpu_id = "CPU0123";
  /// What a sign statement says of the device when it is provisioned well.
  static constexpr const char* facts =
      R"("tee_n":"maker","tee_v":"7.1","fp_n":"sensor\/1","fp_v":"2.0","cpu_id":"CPU0123")";

  fuzz_device device;
  std::optional<testing_support::played_quil> quil;
  known_key attestation{2048}, key{1024};  // all blobs are of the one key, which is its own signer too
  std::array<soter_blob, soter_key_count> blobs;

  soter_device();

  /// provision puts a provisioning TA there that has everything.
  void provision();

 private:
  bytes import(param_writer params);
};

}  // namespace fuzzing

#endif  // FUZZ_SOTER_DEVICE_H_
