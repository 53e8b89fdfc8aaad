// Export statements: {"counter":…,"uid":…,"pub_key":…}.
#include "platform/handles.h"
#include "platform/trace.h"
#include "soter/public_key_pem.h"
#include "soter/resolve_key.h"
#include "soter/soter_enhance.h"
#include "soter/soter_init.h"
#include "soter/statement_members.h"
#include "soter/statement_signature.h"
#include "soter/text.h"

namespace keymaster {
namespace {

constexpr uint32_t pem_capacity = 1024;

TEE_Result add_public_key(json_object* object, std::span<const uint8_t> key_data) {
  heap_bytes pem;
  if (!pem.allocate(pem_capacity)) return TEE_ERROR_OUT_OF_MEMORY;
  uint32_t key_size = 0, length = 0;
  const object_handle key{resolve_key_from_data(key_data, &key_size)};
  if (!key) {
    TRACE_ERROR("resolve key from data stream error\n");
    return TEE_ERROR_BAD_FORMAT;
  }
  if (TEE_Result r = export_rsa_public_key(key.get(), key_size, pem.data(), pem.size(), &length); r != TEE_SUCCESS) {
    TRACE_ERROR("export public key error\n");
    return r;
  }
  if (const int rc = json_object_set_string(object, "pub_key", reinterpret_cast<const char*>(pem.data())); rc != 0) {
    TRACE_ERROR("set publickey error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return TEE_SUCCESS;
}

TEE_Result add_members(json_object* object, const keymaster_key_param_set_t& params,
                       std::span<const uint8_t> key_data) {
  if (key_param_set_contains(params, KM_TAG_SOTER_COUNTED)) {
    TRACE_DEBUG("This key need increase the counter");
    if (TEE_Result r = add_counter(object); r != TEE_SUCCESS) return r;
  }
  if (const keymaster_key_param_t* const uid = key_param_set_get_unique(params, KM_TAG_SOTER_UID); uid != nullptr) {
    TRACE_DEBUG("soter key has uid\n");
    if (const int rc = json_object_set_number(object, "uid", uid->integer); rc != 0) {
      TRACE_ERROR("set number error %x\n", rc);
      return TEE_ERROR_BAD_STATE;
    }
  }
  return add_public_key(object, key_data);
}

/// The text of the statement; null, with the result set, when there is none.
char* make_text(const keymaster_key_param_set_t& params, std::span<const uint8_t> key_data, TEE_Result* result) {
  const json_root root{json_value_init_object()};
  json_object* const object = statement_object(root);
  *result = object == nullptr ? TEE_ERROR_OUT_OF_MEMORY : add_members(object, params, key_data);
  if (*result != TEE_SUCCESS) return nullptr;
  char* const text = json_serialize_to_string(root.get());
  if (text == nullptr) {
    TRACE_ERROR("json serialization error\n");
    *result = TEE_ERROR_BAD_STATE;
  }
  return text;
}

/// Opens the blob that the key names as its signer.
TEE_Result open_signer(const keymaster_key_param_set_t& params, object_handle& key, uint32_t* key_size) {
  const keymaster_key_param_t* signer = key_param_set_get_unique(params, KM_TAG_SOTER_SIGNING_KEY_BLOB);
  if (signer != nullptr) {
    TRACE_DEBUG("use key blob argument to retrieve sign key\n");
  } else {
    signer = key_param_set_get_unique(params, KM_TAG_SOTER_SIGNING_KEY_NAME);
    if (signer == nullptr) {
      TRACE_ERROR("no sign key with key blob\n");
      return TEE_ERROR_ITEM_NOT_FOUND;
    }
    TRACE_DEBUG("use key name argument as key blob to retrieve sign key\n");
  }
  key.reset(retrieve_key_from_pobj(blob_bytes(*signer), key_size));
  return TEE_SUCCESS;
}

TEE_Result choose_signer(const keymaster_key_param_set_t& params, object_handle& key, uint32_t* key_size) {
  if (key_param_set_contains(params, KM_TAG_SOTER_SIGNED_BY_ATTK)) {
    TRACE_DEBUG("soter use attkey sign\n");
    if (TEE_Result r = soter_ensure_ready(); r != TEE_SUCCESS) {
      TRACE_ERROR("soter is not ready\n");
      return r;
    }
    key.reset(convert_key_to_object(&attk_key_pair, key_size));
  } else if (key_param_set_contains(params, KM_TAG_SOTER_SIGNED_BY_KEY)) {
    TRACE_DEBUG("soter use normal key sign\n");
    if (TEE_Result r = open_signer(params, key, key_size); r != TEE_SUCCESS) return r;
  } else {
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (key) return TEE_SUCCESS;
  TRACE_ERROR("Sign key is null\n");
  return TEE_ERROR_BAD_STATE;
}

}  // namespace

TEE_Result soter_enhance_export_key(const keymaster_key_param_set_t& params, std::span<const uint8_t> key_data,
                                    uint8_t* output, uint32_t* output_length) {
  TEE_Result result = TEE_SUCCESS;
  const json_text text{make_text(params, key_data, &result)};
  if (!text) return result;
  object_handle key;
  uint32_t key_size = 0;
  if (TEE_Result r = choose_signer(params, key, &key_size); r != TEE_SUCCESS) return r;

  const std::span<const uint8_t> signed_text = text_bytes(text.get());  // without the NUL
  secret_bytes signature;
  if (!signature.allocate(statement_signature_capacity)) return TEE_ERROR_OUT_OF_MEMORY;
  uint32_t signature_length = signature.size();
  if (TEE_Result r = digest_and_sign(key.get(), key_size, signed_text.data(), static_cast<uint32_t>(signed_text.size()),
                                     signature.data(), &signature_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("sign data error 0x%x\n", r);
    return r;
  }
  return pack_statement(signed_text, signature.span().first(signature_length), output, output_length);
}

}  // namespace keymaster
