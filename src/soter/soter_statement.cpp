// Sign statements: {"raw":…,"fid":…,"counter":…,"uid":…,"tee_n":…,"tee_v":…,"fp_n":…,"fp_v":…,"cpu_id":…}.
#include <algorithm>

#include "platform/trace.h"
#include "soter/finger_id.h"
#include "soter/soter_enhance.h"
#include "soter/soter_init.h"
#include "soter/statement_members.h"
#include "soter/text.h"

namespace keymaster {
namespace {

const char* property_text(const vlb_t& property) {
  return reinterpret_cast<const char*>(property.buf);
}

/// The message becomes a text of the statement, so it must be one.
TEE_Result add_raw(json_object* object, std::span<const uint8_t> raw) {
  const auto nul = std::find(raw.begin(), raw.end(), uint8_t{0});
  if (nul != raw.end() || !is_utf8(raw)) {
    TRACE_ERROR("Not a valid utf8 string, strlen(raw) %d length %d", static_cast<int>(nul - raw.begin()),
                static_cast<int>(raw.size()));
    return TEE_ERROR_BAD_FORMAT;
  }
  if (const int rc = json_object_set_string(object, "raw", reinterpret_cast<const char*>(raw.data())); rc != 0) {
    TRACE_ERROR("set raw message error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return TEE_SUCCESS;
}

TEE_Result add_finger_id(json_object* object) {
  uint32_t fid = soter_no_fid;
  if (TEE_Result r = soter_get_fid(&fid); r != TEE_SUCCESS) {
    TRACE_INFO("get finger id error %x, continue without fid\n", r);
    return TEE_SUCCESS;
  }
  if (const int rc = json_object_set_number(object, "fid", fid); rc != 0) {
    TRACE_ERROR("set finger id error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return TEE_SUCCESS;
}

TEE_Result add_properties(json_object* object) {
  if (const int rc = json_object_set_string(object, "tee_n", property_text(soter_prop_set.tee_name)); rc != 0) {
    TRACE_ERROR("set tee name error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  if (const int rc = json_object_set_string(object, "tee_v", property_text(soter_prop_set.tee_version)); rc != 0) {
    TRACE_ERROR("set tee version error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  if (const int rc = json_object_set_string(object, "fp_n", property_text(soter_prop_set.fp_sensor_name)); rc != 0) {
    TRACE_ERROR("set fp sensor name error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  if (const int rc = json_object_set_string(object, "fp_v", property_text(soter_prop_set.fp_sensor_version)); rc != 0) {
    TRACE_ERROR("set fp sensor version error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  if (const int rc = json_object_set_string(object, "cpu_id", property_text(soter_prop_set.cpu_id)); rc != 0) {
    TRACE_ERROR("set cpu id error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return TEE_SUCCESS;
}

TEE_Result add_members(json_object* object, std::span<const uint8_t> raw, uint32_t uid) {
  if (TEE_Result r = add_raw(object, raw); r != TEE_SUCCESS) return r;
  if (TEE_Result r = add_finger_id(object); r != TEE_SUCCESS) return r;
  if (TEE_Result r = add_counter(object); r != TEE_SUCCESS) return r;
  if (const int rc = json_object_set_number(object, "uid", uid); rc != 0) {
    TRACE_ERROR("set uid error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return add_properties(object);
}

}  // namespace

char* produce_soter_sign_json(std::span<const uint8_t> raw, uint32_t uid, TEE_Result* result) {
  *result = soter_ensure_ready();
  if (*result != TEE_SUCCESS) {
    TRACE_ERROR("soter is not ready\n");
    return nullptr;
  }
  const json_root root{json_value_init_object()};
  json_object* const object = statement_object(root);
  *result = object == nullptr ? TEE_ERROR_OUT_OF_MEMORY : add_members(object, raw, uid);
  if (*result != TEE_SUCCESS) return nullptr;
  char* const text = json_serialize_to_string(root.get());
  if (text == nullptr) {
    TRACE_ERROR("json serialization error\n");
    *result = TEE_ERROR_BAD_STATE;
    return nullptr;
  }
  TRACE_DEBUG("%s success", __func__);
  return text;
}

}  // namespace keymaster
