#include "soter/soter_properties.h"

#include <algorithm>
#include <cstring>

#include "platform/trace.h"
#include "quil/quil_client.h"

namespace keymaster {
namespace {

constexpr uint32_t tee_property_capacity = 64;

TEE_Result init_fp_uuid(const tlv_box* box, TEE_UUID* uuid) {
  const uint8_t* value = nullptr;
  uint32_t length = 0;
  if (tlv_box_get_bytes_ptr(box, QUIL_TAG_FP_UUID, &value, &length) != 0) {
    TRACE_DEBUG("get fp uuid bytes ptr error");
    return TEE_ERROR_GENERIC;
  }
  static_assert(sizeof *uuid == 16);
  if (length != sizeof *uuid) {
    TRACE_DEBUG("fp_uuid length unmatch expect %zu actual %d\n", sizeof *uuid, length);
    return TEE_ERROR_GENERIC;
  }
  std::memcpy(uuid, value, sizeof *uuid);
  return TEE_SUCCESS;
}

/// Reads a platform property into the block of `text`, whose length a failure leaves alone.
TEE_Result read_tee_property(const char* name, vlb_t* text) {
  uint32_t length = 0;
  const TEE_Result result = get_tee_property(name, reinterpret_cast<char*>(text->buf), tee_property_capacity, &length);
  if (result == TEE_SUCCESS) text->length = std::min(length, tee_property_capacity);
  return result;
}

TEE_Result init_tee_name(vlb_t* name) {
  if (!vlb_allocate(name, tee_property_capacity)) {
    TRACE_DEBUG("No memory for tee_name");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  const TEE_Result result = read_tee_property("gpd.tee.trustedos.manufacturer", name);
  if (result != TEE_SUCCESS) TRACE_DEBUG("get_tee_property os manufacturer error 0x%x\n", result);
  return result;
}

TEE_Result init_tee_version(vlb_t* version) {
  if (!vlb_allocate(version, tee_property_capacity)) {
    TRACE_DEBUG("No memory for tee_version");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  return read_tee_property("gpd.tee.trustedos.implementation.version", version);
}

TEE_Result init_from_box(soter_prop_set_t* props, const tlv_box* box) {
  if (TEE_Result r = init_prop_with_tag(box, QUIL_TAG_FP_SENSOR_NAME, &props->fp_sensor_name); r != TEE_SUCCESS) {
    return r;
  }
  if (TEE_Result r = init_prop_with_tag(box, QUIL_TAG_FP_SENSOR_VERSION, &props->fp_sensor_version); r != TEE_SUCCESS) {
    return r;
  }
  return init_fp_uuid(box, &props->fp_uuid);
}

TEE_Result init_all(soter_prop_set_t* props) {
  tlv_box* received = nullptr;
  const TEE_Result retrieved = retrieve_soter_property(&received, QUIL_PROPERTY_SOTER.group);
  const tlv_box_owner box{received};
  if (retrieved != TEE_SUCCESS) return retrieved;
  if (TEE_Result r = init_from_box(props, box.get()); r != TEE_SUCCESS) return r;
  if (TEE_Result r = init_soter_cpuid(&props->cpu_id); r != TEE_SUCCESS) {
    TRACE_DEBUG("init soter cpuid error 0x%x\n", r);
    return r;
  }
  if (TEE_Result r = init_tee_name(&props->tee_name); r != TEE_SUCCESS) return r;
  return init_tee_version(&props->tee_version);
}

}  // namespace

TEE_Result init_soter_prop_set(soter_prop_set_t* props) {
  const TEE_Result result = init_all(props);
  if (result != TEE_SUCCESS) {
    TRACE_DEBUG("Init soter data fails, 0x%x\n", result);
    free_soter_prop_set(props);
    return result;
  }
  TRACE_DEBUG("Init soter data success\n");
  return TEE_SUCCESS;
}

TEE_Result retrieve_soter_property(tlv_box** out_box, uint16_t tag) {
  *out_box = nullptr;
  heap_bytes buf;
  if (!buf.allocate(QUIL_PROPERTY_CAPACITY)) {
    TRACE_ERROR("No memory for buf");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  const quil_property_request request = {tag, QUIL_PROPERTY_SOTER.item};
  uint32_t length = buf.size();
  if (TEE_Result r = retrieve_property_from_quil(&request, buf.data(), &length); r != TEE_SUCCESS) return r;
  if (length > buf.size()) return TEE_ERROR_SHORT_BUFFER;
  *out_box = tlv_box_parse(buf.data(), length);
  if (*out_box == nullptr) {
    TRACE_ERROR("parse property tlv box error");
    return TEE_ERROR_GENERIC;
  }
  return TEE_SUCCESS;
}

TEE_Result init_prop_with_tag(const tlv_box* box, uint16_t tag, vlb_t* property) {
  vlb_free(property);
  const uint8_t* value = nullptr;
  uint32_t length = 0;
  if (tlv_box_get_bytes_ptr(box, tag, &value, &length) != 0) {
    TRACE_DEBUG("tlv_box_get_bytes_ptr error for tag 0x%x\n", tag);
    return TEE_ERROR_GENERIC;
  }
  if (!vlb_allocate(property, length)) {
    TRACE_DEBUG("No memory for prop->buf, tag 0x%x length %u\n", tag, length);
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  std::memcpy(property->buf, value, length);
  return TEE_SUCCESS;
}

TEE_Result init_soter_cpuid(vlb_t* cpu_id) {
  if (!vlb_allocate(cpu_id, QUIL_CPU_ID_CAPACITY)) {
    TRACE_DEBUG("No memory for cpu_id");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  uint32_t length = QUIL_CPU_ID_CAPACITY;
  TEE_Result result = retrieve_property_from_quil(&QUIL_PROPERTY_CPU_ID, cpu_id->buf, &length);
  if (result == TEE_SUCCESS && length > QUIL_CPU_ID_CAPACITY) result = TEE_ERROR_SHORT_BUFFER;
  if (result != TEE_SUCCESS) {
    TRACE_DEBUG("retrieve soter cpu id error 0x%x\n", result);
    vlb_free(cpu_id);
    return result;
  }
  cpu_id->length = length;
  return TEE_SUCCESS;
}

TEE_Result get_tee_property(const char* name, char* buffer, uint32_t capacity, uint32_t* out_length) {
  *out_length = capacity;
  const TEE_Result result = TEE_GetPropertyAsString(TEE_PROPSET_TEE_IMPLEMENTATION, name, buffer, out_length);
  // The line speaks of the client, although the property is the platform's; who reads the log knows it so.
  if (result != TEE_SUCCESS) TRACE_DEBUG("get client id property error, 0x%x\n", result);
  return result;
}

void free_soter_prop_set(soter_prop_set_t* props) {
  vlb_t* const properties[] = {&props->fp_sensor_name, &props->fp_sensor_version, &props->cpu_id, &props->tee_name,
                               &props->tee_version};
  for (vlb_t* const property : properties) vlb_free(property);
  props->fp_uuid = {};
}

}  // namespace keymaster
