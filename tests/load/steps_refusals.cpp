// What the TA must refuse, each time with the answer that the protocol has for it.
#include "src/params/keymaster_defs.h"
#include "tee_api_constants.h"
#include "tests/load/steps.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;
using namespace testing_support;

namespace load {
namespace {

constexpr std::uint32_t mode_value_in_out = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_NONE, TEEC_NONE, TEEC_NONE);
constexpr std::int32_t left_alone = 0x1234;

/// The handle of an operation on one of the AES keys, or nothing when there is no place.
std::optional<std::uint32_t> begun(desk& d) {
  const answer given = d.client.begin(KM_PURPOSE_ENCRYPT, d.pick(d.keys.aes).blob, cipher(KM_MODE_CTR));
  if (is_full(given)) return std::nullopt;
  expect_ok(given, "begin");
  expect(given.b != 0, "a handle is never 0");
  return given.b;
}

void expect_unknown(desk& d, std::uint32_t handle) {
  expect_none(d.client.update(handle, d.message()), TEEC_SUCCESS, KM_ERROR_INVALID_OPERATION_HANDLE,
              "update of no operation");
  expect_none(d.client.finish(handle), TEEC_SUCCESS, KM_ERROR_INVALID_OPERATION_HANDLE, "finish of no operation");
  expect(d.client.abort(handle), TEEC_SUCCESS, KM_ERROR_INVALID_OPERATION_HANDLE, "abort of no operation");
  // The handle comes before the body.
  const answer broken = d.client.call(KM_COMMAND_UPDATE, handle, 0, from_hex("ff"), 16);
  expect_none(broken, TEEC_SUCCESS, KM_ERROR_INVALID_OPERATION_HANDLE, "a broken update of no operation");
}

}  // namespace

// The dispatcher's refusals: no slot is touched.
bool call_wrongly(desk& d) {
  const answer unknown = d.client.call(24 + d.below(0xFEDC), left_alone, 7, d.message(), d.below(20'000));
  expect(unknown, TEEC_ERROR_BAD_PARAMETERS, left_alone, "an unknown command");
  const answer types = d.client.call_types(
      1 + d.below(22), TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_INOUT, TEEC_NONE),
      left_alone, 7, d.message(), 100);
  expect(types, TEEC_ERROR_BAD_PARAMETERS, left_alone, "wrong types");
  const answer filled = d.client.call(KM_COMMAND_GENERATE_KEY, left_alone, 7, aes_key().marshal(), 4096);
  expect(filled, TEEC_ERROR_BAD_PARAMETERS, left_alone, "a slot that is not clear");
  const answer word = d.client.call(KM_COMMAND_ABORT, left_alone, 7, std::nullopt, std::nullopt);
  expect(word, TEEC_ERROR_BAD_PARAMETERS, left_alone, "a word that is not clear");
  expect(unknown.b == 7 && types.b == 7 && filled.b == 7 && word.b == 7, "the dispatcher touches no slot");
  const answer missing = d.client.call_types(KM_COMMAND_BEGIN, mode_value_in_out, left_alone, 0, {}, 0);
  expect(missing, TEEC_ERROR_BAD_PARAMETERS, left_alone, "begin without its bodies");
  return true;
}

bool send_malformed(desk& d) {
  bytes set = aes_key().marshal();
  set.resize(set.size() - 1 - d.below(20));
  expect_none(d.client.call(KM_COMMAND_GENERATE_KEY, 0, 0, set, 4096), TEEC_ERROR_BAD_PARAMETERS,
              KM_ERROR_UNKNOWN_ERROR, "a cut parameter set");
  const bytes& blob = d.pick(d.keys.ec).blob;
  bytes body = key_body(blob, {}, {});
  body.resize(d.below(static_cast<std::uint32_t>(body.size())));
  expect_none(d.client.call(KM_COMMAND_EXPORT_KEY, 0, 0, body, 4096), TEEC_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR,
              "a cut request");
  const bytes huge = join({u32(0xFFFF'FFFF), d.message()});
  expect_none(d.client.call(KM_COMMAND_GET_KEY_CHARACTER, 0, 0, huge, 4096), TEEC_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR,
              "a length beyond all");
  expect_none(d.client.call(KM_COMMAND_IMPORT_KEY, 0, 0, huge, 4096), TEEC_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR,
              "an import with a length beyond all");
  expect_none(d.client.generate(aes_key(), d.below(100)), TEEC_ERROR_SHORT_BUFFER, KM_ERROR_UNKNOWN_ERROR,
              "no room for a blob");
  return true;
}

bool misuse_keys(desk& d) {
  const bytes& aes = d.pick(d.keys.aes).blob;
  const bytes& rsa = d.pick(d.keys.rsa).signing;
  const bytes forged = flip(aes, aes.size() - 1 - d.below(100));
  expect_none(d.client.characteristics(forged), TEE_ERROR_MAC_INVALID, KM_ERROR_UNKNOWN_ERROR, "a changed blob");
  expect_none(d.client.begin(KM_PURPOSE_ENCRYPT, forged, cipher(KM_MODE_ECB)), TEE_ERROR_MAC_INVALID,
              KM_ERROR_UNKNOWN_ERROR, "begin with a changed blob");
  expect_none(d.client.export_key(pattern(d.below(20))), TEEC_SUCCESS, KM_ERROR_INVALID_KEY_BLOB, "no blob");
  expect_none(d.client.begin(KM_PURPOSE_SIGN, aes, cipher(KM_MODE_ECB)), TEEC_SUCCESS, KM_ERROR_UNSUPPORTED_PURPOSE,
              "a purpose that AES does not serve");
  expect_none(d.client.begin(KM_PURPOSE_DECRYPT, rsa, signature(KM_DIGEST_NONE, KM_PAD_NONE)), TEEC_SUCCESS,
              KM_ERROR_INCOMPATIBLE_PURPOSE, "a purpose that the key does not list");
  expect_none(d.client.begin(KM_PURPOSE_SIGN, rsa, signature(KM_DIGEST_SHA_2_256, KM_PAD_PKCS7)), TEEC_SUCCESS,
              KM_ERROR_INCOMPATIBLE_PADDING_MODE, "a padding that the key does not list");
  expect_none(d.client.begin(KM_PURPOSE_ENCRYPT, aes, gcm(64)), TEEC_SUCCESS, KM_ERROR_INVALID_MAC_LENGTH,
              "a tag shorter than the key's minimum");
  const param_list other = ec_digest(KM_DIGEST_SHA1).add_blob(KM_TAG_APPLICATION_ID, join({{1}, d.message()}));
  expect_none(d.client.begin(KM_PURPOSE_SIGN, d.pick(d.keys.ec).blob, other), TEEC_SUCCESS, KM_ERROR_INVALID_KEY_BLOB,
              "an application that the key is not bound to");
  return true;
}

// 0 is never a handle. The others' handles are none of this client's business, so it tries no other number.
bool misuse_handles(desk& d) {
  expect_unknown(d, 0);
  return true;
}

bool abort_operation(desk& d) {
  const auto handle = begun(d);
  if (!handle) return false;
  if (d.one_in(2)) expect_ok(d.client.update(*handle, bytes(100), {}, 132), "update");
  expect_ok(d.client.abort(*handle), "abort");
  expect_unknown(d, *handle);
  return true;
}

// Any failure but that of the handle ends the operation.
bool break_operation(desk& d) {
  const auto handle = begun(d);
  if (!handle) return false;
  const param_list aad = param_list{}.add_blob(KM_TAG_ASSOCIATED_DATA, {1});
  switch (d.below(4)) {
    case 0:
      expect(d.client.update(*handle, bytes(10), aad), TEEC_SUCCESS, KM_ERROR_INVALID_TAG,
             "associated data without GCM");
      break;
    case 1:
      expect(d.client.call(KM_COMMAND_UPDATE, *handle, 0, join({prefixed(bytes(5)), prefixed(bytes(3))}), 64),
             TEEC_SUCCESS, KM_ERROR_INVALID_ARGUMENT, "an update whose parameters do not unmarshal");
      break;
    case 2:
      expect(d.client.call(KM_COMMAND_UPDATE, *handle, 0, join({u32(100), bytes(99)}), 64), TEEC_ERROR_GENERIC,
             KM_ERROR_UNKNOWN_ERROR, "an update that is cut");
      break;
    default:
      expect_none(d.client.finish(*handle, {}, {}, 7), TEEC_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR,
                  "finish without room for its answer");
  }
  expect_unknown(d, *handle);
  return true;
}

}  // namespace load
