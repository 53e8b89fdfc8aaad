// The advice that goes with a failure. The first row that fits wins; an empty step fits every command.
#include <algorithm>
#include <array>
#include <string_view>

#include "client/lib/error.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"
#include "tee_client_api.h"

namespace keymaster::client {
namespace {

constexpr std::uint32_t tee_error_mac_invalid = 0xFFFF3071;
constexpr std::uint32_t tee_error_storage_no_space = 0xFFFF3041;
constexpr std::uint32_t tee_error_overflow = 0xFFFF300F;
constexpr std::uint32_t ksk_error_deleted = 0xF0100001;
constexpr std::uint32_t ksk_error_rpmb_gone = 0xF0100003;

/// Where nothing better is known.
constexpr std::string_view look_at_the_trace =
    "run it again with KEYMASTER_TRACE=error (kmctl --trace error): the trace names the call that failed";

// What more than one step is answered with.
constexpr std::string_view no_companion =
    "the TEE has no image of this TA: build it, or point KEYMASTER_TA_PATH at the folder of the .ta files";
constexpr std::string_view device_is_locked = "the device is locked: its key and its properties stay as they are";
constexpr std::string_view management_is_denied = "the server answers this to its own user and to root alone";
constexpr std::string_view no_such_finger = "no finger has this id: kmctl finger list shows those that are enrolled";
constexpr std::string_view wrong_password =
    "the password is wrong, or the handle is not one of this user on this device; after five failures in a row there "
    "is a wait";
constexpr std::string_view wait_for_the_password =
    "too many wrong passwords in a row: until the time has passed the right one is refused as well; it begins anew "
    "whenever the secure world starts (kmctl: --wait sits it out)";

struct tee_advice {
  std::string_view step;
  std::uint32_t result;
  std::string_view text;
};

constexpr std::array tee_advices = std::to_array<tee_advice>({
    {"connect", TEEC_ERROR_BUSY,
     "another process uses this TEE: wait for it to end, or choose another state folder; or its server has as many "
     "clients as it takes"},
    {"connect", TEEC_ERROR_COMMUNICATION,
     "no server answers at this socket: start one (teed --state FOLDER --socket PATH), or look at the path"},
    {"connect", TEEC_ERROR_ACCESS_DENIED, "you may not connect to this socket: look at its file's permissions"},
    {"connect", TEEC_ERROR_NOT_SUPPORTED, "client and server are of different versions"},
    {"tee_status", TEEC_ERROR_ACCESS_DENIED, management_is_denied},
    {"tee_log", TEEC_ERROR_ACCESS_DENIED, management_is_denied},
    {"tee_stop", TEEC_ERROR_ACCESS_DENIED, management_is_denied},
    {"connect", TEEC_ERROR_BAD_STATE,
     "a newer version wrote the state: use that version, or choose another state folder"},
    {"connect", TEEC_ERROR_SECURITY,
     "the state does not authenticate: it was altered or copied together from two devices; restore it or choose "
     "another"},
    {"connect", TEEC_ERROR_BAD_FORMAT,
     "a text file of the state folder, most likely `settings`, can't be parsed: --trace error names the file and the "
     "line, and docs/hosted-tee.md tells what settings may say"},
    {"connect", TEEC_ERROR_BAD_PARAMETERS,
     "a TEE name has the form embedded:FOLDER, and the folder is new, empty or a device's state: one that holds "
     "something else is left alone"},
    {"connect", TEEC_ERROR_OUT_OF_MEMORY, "the system has no memory left: end other programs"},
    {"connect", TEEC_ERROR_GENERIC, "check that the state folder can be made and written, and that its disk has room"},
    {"open_session", TEEC_ERROR_ITEM_NOT_FOUND,
     "the TEE has no image of the Keymaster TA: build it, or point KEYMASTER_TA_PATH at the folder of the .ta files"},
    {"open_session", TEEC_ERROR_BAD_FORMAT,
     "the image of the Keymaster TA is damaged or belongs to another version: build it again, or point "
     "KEYMASTER_TA_PATH at the folder of the right .ta files"},
    {"open_session", tee_error_storage_no_space,
     "the TA could not store its key storage key: make room on the disk of the state folder"},
    {"open_session", TEEC_ERROR_OUT_OF_MEMORY, "the TA could not start for want of memory: end other programs"},
    {"open_session", ksk_error_deleted,
     "the stored key storage key was malformed and is deleted now; the next start makes a new one, and blobs sealed "
     "under the old one are lost"},
    {"open_provisioning", TEEC_ERROR_ITEM_NOT_FOUND, no_companion},
    {"open_fingerprint", TEEC_ERROR_ITEM_NOT_FOUND, no_companion},
    {"open_authenticator", TEEC_ERROR_ITEM_NOT_FOUND, no_companion},
    {"open_device_information", TEEC_ERROR_ITEM_NOT_FOUND,
     "this TEE offers no TA that tells its properties, which a factory record needs"},
    {"generate_attk", TEEC_ERROR_ACCESS_DENIED, device_is_locked},
    {"put_key", TEEC_ERROR_ACCESS_DENIED, device_is_locked},
    {"put_property", TEEC_ERROR_ACCESS_DENIED, device_is_locked},
    {"lock_device", TEEC_ERROR_ACCESS_DENIED, device_is_locked},
    {"put_key", TEEC_ERROR_BAD_FORMAT, "the TA does not take the key: client and TA are of different versions"},
    {"enrol_finger", TEEC_ERROR_BAD_PARAMETERS, "a finger belongs to a user: the secure id 0 stands for nobody"},
    {"enrol_finger", tee_error_overflow, "no more fingers fit in: remove one first"},
    {"touch_finger", TEEC_ERROR_ITEM_NOT_FOUND, no_such_finger},
    {"remove_finger", TEEC_ERROR_ITEM_NOT_FOUND, no_such_finger},
    {"enrol_password", TEEC_ERROR_ACCESS_DENIED, wrong_password},
    {"verify_password", TEEC_ERROR_ACCESS_DENIED, wrong_password},
    {"enrol_password", TEEC_ERROR_BUSY, wait_for_the_password},
    {"verify_password", TEEC_ERROR_BUSY, wait_for_the_password},
    {"enrol_password", TEEC_ERROR_BAD_PARAMETERS, "a password has 1 to 1024 bytes"},
    {"", tee_error_mac_invalid,
     "the blob does not authenticate: it was altered, or another device sealed it (another state folder)"},
    {"", ksk_error_rpmb_gone, "the blob was sealed with the RPMB key, and this device has no RPMB storage now"},
    {"", TEEC_ERROR_TARGET_DEAD, "the TA stopped: open a new session; blobs stay valid, running operations are lost"},
    {"", TEEC_ERROR_OUT_OF_MEMORY,
     "the TA's heap is 512 KiB: use less input at once, or finish other operations first"},
    {"", TEEC_ERROR_BUSY, "the TEE is busy: try again"},
    {"", TEEC_ERROR_SHORT_BUFFER,
     "the answer is larger than the room for it: client and TA are of different versions, build both again"},
    {"", TEEC_ERROR_NOT_IMPLEMENTED, "the TA does not have this command: kmctl info lists what it offers"},
    {"", TEEC_ERROR_BAD_FORMAT, "the TA can't read the request: client and TA are of different versions"},
    {"", TEEC_ERROR_COMMUNICATION, "the way to the TEE broke: open a new session"},
    {"", tee_error_storage_no_space, "make room on the disk of the state folder"},
    {"generate_key", TEEC_ERROR_BAD_PARAMETERS,
     "the platform refuses these parameters: a public exponent is odd and at least 3"},
    {"generate_key", TEEC_ERROR_NOT_SUPPORTED,
     "the platform does not make keys of this size: RSA takes 512 to 8192 bits, EC the sizes of the NIST prime curves"},
    {"begin", TEEC_ERROR_NOT_SUPPORTED,
     "the platform does not serve keys of this size: RSA takes 512 to 8192 bits, EC the sizes of the NIST prime "
     "curves"},
    {"begin", TEEC_ERROR_BAD_PARAMETERS, "the platform refuses the key's components: the imported key was not sound"},
    {"finish", TEEC_ERROR_BAD_PARAMETERS,
     "the platform refuses the input: RSA without a digest takes a number below the key's modulus, ECB and CBC without "
     "padding take whole blocks of 16 bytes"},
});

struct keymaster_advice {
  std::string_view step;
  std::int32_t error;
  std::string_view text;
};

constexpr std::array keymaster_advices = std::to_array<keymaster_advice>({
    {"", KM_ERROR_UNSUPPORTED_PURPOSE, "the algorithm does not serve this purpose: kmctl info lists what it does"},
    {"", KM_ERROR_INCOMPATIBLE_PURPOSE, "the key was not made for this purpose: look at its characteristics"},
    {"", KM_ERROR_UNSUPPORTED_ALGORITHM, "the TA does not offer this algorithm: kmctl info lists what it offers"},
    {"", KM_ERROR_UNSUPPORTED_KEY_SIZE,
     "choose a size of this algorithm: RSA takes multiples of 8 up to 8192 bits, EC 192, 224, 256, 384 or 521, AES "
     "128, 192 or 256; HMAC takes multiples of 8 from what its digest demands (192 for sha-256) up to 512 or 1024"},
    {"", KM_ERROR_UNSUPPORTED_BLOCK_MODE,
     "the algorithm does not offer this block mode: kmctl info lists those it does"},
    {"", KM_ERROR_INCOMPATIBLE_BLOCK_MODE, "the key does not allow this block mode: look at its characteristics"},
    {"", KM_ERROR_UNSUPPORTED_MAC_LENGTH, "ask for a tag of at most 128 bits, in whole bytes"},
    {"", KM_ERROR_UNSUPPORTED_PADDING_MODE, "this purpose does not offer this padding: kmctl info lists those it does"},
    {"", KM_ERROR_INCOMPATIBLE_PADDING_MODE, "the key does not allow this padding: look at its characteristics"},
    {"", KM_ERROR_UNSUPPORTED_DIGEST,
     "the algorithm does not offer this digest (kmctl info lists those it does), or an HMAC key names none or several"},
    {"", KM_ERROR_INCOMPATIBLE_DIGEST,
     "the key does not allow this digest, or it does not go with the padding: PSS and OAEP need SHA-1 or SHA-2 and "
     "room in the key, raw padding and PKCS#1 encryption need no digest"},
    {"", -17, "keys of this algorithm never leave the TA: only RSA and EC keys have a public part"},
    {"update", KM_ERROR_INVALID_INPUT_LENGTH,
     "the input is longer than this key can take at once: sign with a digest (without one, RSA takes at most the key's "
     "length, 11 bytes less with pkcs1-1-5-sign); what RSA encrypts must fit into the key, so encrypt an AES key with "
     "it"},
    {"finish", KM_ERROR_INVALID_INPUT_LENGTH,
     "the input has a length that cannot be: ECB and CBC work on whole blocks of 16 bytes unless pkcs7 fills the last "
     "one; OAEP leaves room for the key's length less two digests and 2 bytes, pkcs1-1-5-encrypt for 11 bytes less"},
    {"", KM_ERROR_INVALID_INPUT_LENGTH, "the input is longer than this key can take at once"},
    {"", KM_ERROR_KEY_NOT_YET_VALID, "the key's active date lies ahead: check the clock"},
    {"", KM_ERROR_KEY_EXPIRED, "the key's date for this purpose has passed: make a new key"},
    {"", KM_ERROR_KEY_USER_NOT_AUTHENTICATED,
     "the key's user must authenticate, in the way that the key asks for: pass a fresh auth token (kmctl: --finger, or "
     "--auth-handle)"},
    {"", KM_ERROR_INVALID_OPERATION_HANDLE, "the operation has ended (any failure ends it): begin again"},
    {"", KM_ERROR_VERIFICATION_FAILED,
     "the signature, MAC or tag is not one of this key over this input: check that they belong together, with padding, "
     "digest, nonce and associated data"},
    {"", KM_ERROR_INSUFFICIENT_BUFFER_SPACE,
     "the answer is larger than the room for it: client and TA are of different versions, build both again"},
    {"", KM_ERROR_TOO_MANY_OPERATIONS,
     "sixteen operations are open, or eight counted keys: finish or abort some first"},
    {"", KM_ERROR_INVALID_KEY_BLOB,
     "the file is not a whole key blob, or the application id or data differ from those the key was made with"},
    {"import_key", KM_ERROR_INVALID_ARGUMENT, "name the algorithm once, and do not state an origin"},
    {"generate_key", KM_ERROR_INVALID_ARGUMENT,
     "name algorithm, size and (for RSA) the public exponent exactly once, and do not state an origin"},
    {"begin", KM_ERROR_INVALID_ARGUMENT,
     "name padding, digest, block mode and MAC length exactly once; a nonce has 12 bytes for gcm and 16 for cbc and "
     "ctr; a key with a user id needs an auth type; an auth token must be of this boot"},
    {"finish", KM_ERROR_INVALID_ARGUMENT,
     "the text has not the padding that it must have: key, padding, digest and nonce must be those of the encryption, "
     "and the ciphertext unchanged and whole (without padding, RSA takes a number below the key's modulus)"},
    {"", KM_ERROR_INVALID_ARGUMENT, "the parameters do not fit the command: state each one once"},
    {"", KM_ERROR_INVALID_TAG, "leave out what this command does not take, and state the rest once"},
    {"", KM_ERROR_MEMORY_ALLOCATION_FAILED, "the TA's heap is 512 KiB: finish other operations first"},
    {"", KM_ERROR_IMPORT_PARAMETER_MISMATCH, "the stated size or public exponent is not that of the key: leave it out"},
    {"", KM_ERROR_KEY_RATE_LIMIT_EXCEEDED, "the key may not be used again so soon: wait"},
    {"", KM_ERROR_CALLER_NONCE_PROHIBITED, "the key does not allow a nonce of the caller's: let the TA draw it"},
    {"", KM_ERROR_KEY_MAX_OPS_EXCEEDED,
     "the uses of this boot are used up: they begin anew when the secure world starts again"},
    {"", KM_ERROR_INVALID_MAC_LENGTH, "ask for a MAC at least as long as the key's minimum"},
    {"", -58, "state a minimum MAC length: gcm keys need one"},
    {"", KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH,
     "the minimum MAC length must be a multiple of 8: for gcm 96 to 128, for HMAC 64 to the digest's length"},
    {"finish", KM_ERROR_UNKNOWN_ERROR,
     "a MAC is at most as long as its digest: ask for a shorter one; a statement takes a text of some tens of "
     "kilobytes, "
     "and a key that signs with a digest"},
    {"", KM_ERROR_UNIMPLEMENTED, "the algorithm does not have this step: leave it out"},
});

struct soter_advice {
  std::string_view step;
  std::int32_t status;
  std::string_view text;
};

constexpr std::array soter_advices = std::to_array<soter_advice>({
    {"", SOTER_STATUS_NO_ATTK,
     "the device has no attestation key that can be used: kmctl device provision puts one in"},
    {"", SOTER_STATUS_UNREADABLE_ATTK,
     "the attestation key can't be read: kmctl device status tells what is there, and unless the device is locked it "
     "can be provisioned again"},
    {"soter_generate_attk_key_pair", KM_ERROR_UNKNOWN_ERROR,
     "the attestation key or a property is missing: kmctl device status tells which, kmctl device provision puts it "
     "in"},
    {"soter_get_device_id", KM_ERROR_UNKNOWN_ERROR, "the device has no id: kmctl device provision gives it one"},
    {"soter_get_device_id", KM_ERROR_INSUFFICIENT_BUFFER_SPACE,
     "the device's id is longer than this client expects: client and TA are of different versions"},
});

}  // namespace

std::string hint_for(const failure& facts) {
  const auto fits = [&](std::string_view step) { return step.empty() || step == facts.step; };
  if (facts.tee_result != 0) {
    const auto row = std::ranges::find_if(
        tee_advices, [&](const tee_advice& advice) { return advice.result == facts.tee_result && fits(advice.step); });
    return std::string(row == tee_advices.end() ? look_at_the_trace : row->text);
  }
  if (facts.kind == error_kind::soter) {
    const auto row = std::ranges::find_if(soter_advices, [&](const soter_advice& advice) {
      return advice.status == facts.soter_status && fits(advice.step);
    });
    return std::string(row == soter_advices.end() ? look_at_the_trace : row->text);
  }
  const auto row = std::ranges::find_if(keymaster_advices, [&](const keymaster_advice& advice) {
    return advice.error == facts.keymaster_error && fits(advice.step);
  });
  return std::string(row == keymaster_advices.end() ? look_at_the_trace : row->text);
}

}  // namespace keymaster::client
