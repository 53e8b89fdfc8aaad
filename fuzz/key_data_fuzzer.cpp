// Key data and key material from any bytes: what the key modules of all algorithms make of it is a key object or an
// error, and nothing stays behind.
#include <algorithm>
#include <array>
#include <memory>

#include "algorithms/aes/aes_key.h"
#include "algorithms/ec/ec_key.h"
#include "algorithms/ec/ec_key_data.h"
#include "algorithms/hmac/hmac_key.h"
#include "algorithms/rsa/rsa_key.h"
#include "algorithms/rsa/rsa_key_data.h"
#include "fuzz/fuzz_device.h"

using namespace keymaster;

namespace fuzzing {
namespace {

using key_bytes = std::span<const uint8_t>;

TEE_Result resolve_hmac(key_bytes data, TEE_ObjectHandle* key, uint32_t* bits, keymaster_error_t* error) {
  uint32_t object_type = 0;
  return hmac_resolve_key_data(data, key, &object_type, bits, error);
}

struct key_module {
  TEE_Result (*resolve)(key_bytes data, TEE_ObjectHandle* key, uint32_t* bits, keymaster_error_t* error);
  TEE_Result (*import_key)(keymaster_key_param_set_t* params, key_bytes material, secret_bytes& key_data,
                           keymaster_error_t* error);
  TEE_Result (*export_key)(key_bytes data, uint8_t* output, uint32_t* length, keymaster_error_t* error);
};

constexpr std::array<key_module, 4> modules = {{
    {rsa_resolve_key_data, rsa_import_key, rsa_export_key},
    {ec_resolve_key_data, ec_import_key, ec_export_key},
    {aes_resolve_key_data, aes_import_key, aes_export_key},
    {resolve_hmac, hmac_import_key, hmac_export_key},
}};

void check_resolve(const key_module& module, key_bytes data) {
  TEE_ObjectHandle key = TEE_HANDLE_NULL;
  uint32_t bits = 0;
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = module.resolve(data, &key, &bits, &error);
  const bool made = result == TEE_SUCCESS && error == KM_ERROR_OK;
  require(made == (key != TEE_HANDLE_NULL), "a key comes with success alone");
  TEE_FreeTransientObject(key);
}

void check_export(const key_module& module, key_bytes data, std::size_t capacity) {
  const std::unique_ptr<std::uint8_t[]> output(new std::uint8_t[capacity]());
  auto length = static_cast<uint32_t>(capacity);
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = module.export_key(data, output.get(), &length, &error);
  require(result != TEE_SUCCESS || error != KM_ERROR_OK || length <= capacity, "a public key lies in its buffer");
}

/// What imports is key data, which the module reads again.
void check_import(const key_module& module, key_bytes material, uint32_t digest) {
  parameter_set params;
  keymaster_key_param_t param = {};
  param.tag = KM_TAG_DIGEST;
  param.enumerated = digest;
  require(key_param_set_append(&params, param) == KM_ERROR_OK, "the parameters fit");
  param.tag = KM_TAG_MIN_MAC_LENGTH;
  param.integer = 64;
  require(key_param_set_append(&params, param) == KM_ERROR_OK, "the parameters fit");
  secret_bytes key_data;
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = module.import_key(&params, material, key_data, &error);
  if (result == TEE_SUCCESS && error == KM_ERROR_OK) {
    require(static_cast<bool>(key_data), "an imported key has key data");
    check_resolve(module, key_data.span());
  } else {
    require(!key_data, "a failed import has none");
  }
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance&) {
    input_reader in({data, size});
    const key_module& module = in.pick(modules);
    const auto digest = static_cast<uint32_t>(in.below(8));
    const std::size_t capacity = in.u8();
    const bytes rest = in.take(size);
    const std::unique_ptr<std::uint8_t[]> body(new std::uint8_t[rest.size()]);
    std::copy(rest.begin(), rest.end(), body.get());
    check_resolve(module, {body.get(), rest.size()});
    check_export(module, {body.get(), rest.size()}, capacity);
    check_import(module, {body.get(), rest.size()}, digest);
  });
  return 0;
}
