#include "fuzz/soter_device.h"

#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace fuzzing {

soter_device::soter_device() {
  device.world().device().text_properties["gpd.tee.trustedos.manufacturer"] = "maker";
  device.world().device().text_properties["gpd.tee.trustedos.implementation.version"] = "7.1";
  device.open();
  const bytes signer = import({});
  const auto soter = [] { return param_writer{}.add(KM_TAG_SOTER_KEY, 1); };
  const bytes counted_by_attk =
      import(soter().add(KM_TAG_SOTER_SIGNED_BY_ATTK, 1).add(KM_TAG_SOTER_COUNTED, 1).add(KM_TAG_SOTER_UID, uid));
  const bytes by_attk = import(soter().add(KM_TAG_SOTER_SIGNED_BY_ATTK, 1));
  const bytes counted_by_key = import(soter()
                                          .add(KM_TAG_SOTER_SIGNED_BY_KEY, 1)
                                          .add(KM_TAG_SOTER_COUNTED, 0)
                                          .add_blob(KM_TAG_SOTER_SIGNING_KEY_BLOB, signer));
  const bytes by_named_key = import(soter()
                                        .add(KM_TAG_SOTER_SIGNED_BY_KEY, 1)
                                        .add(KM_TAG_SOTER_UID, uid)
                                        .add_blob(KM_TAG_SOTER_SIGNING_KEY_NAME, signer));
  const bytes by_nobody = import(soter().add(KM_TAG_SOTER_COUNTED, 1));
  blobs = {{{counted_by_attk, true, true, true, false},
            {by_attk, false, false, true, false},
            {counted_by_key, true, false, false, true},
            {by_named_key, false, true, false, true},
            {by_nobody, true, false, false, false}}};
  device.close();
}

void soter_device::provision() {
  quil.emplace();
  quil->provision(attestation.components());
  device.world().device().other_tas = &*quil;
}

bytes soter_device::import(param_writer params) {
  params.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA).add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN).add(KM_TAG_NO_AUTH_REQUIRED, 1);
  for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN}) {
    params.add(KM_TAG_PADDING, padding);
  }
  for (const std::uint32_t digest : {KM_DIGEST_NONE, KM_DIGEST_SHA_2_256}) params.add(KM_TAG_DIGEST, digest);
  bytes request;
  append_block(request, params.marshal());
  const bytes material = key.material();
  request.insert(request.end(), material.begin(), material.end());
  const reply made = device.run({KM_COMMAND_IMPORT_KEY, 0, 0, request, 8192, {}});
  require(made.ok(), "the fuzzer's keys are made");
  return {made.response.begin() + 4, made.response.begin() + 4 + u32_at(made.response, 0)};
}

}  // namespace fuzzing
