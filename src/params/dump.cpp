#include "params/dump.h"

#include "platform/trace.h"

namespace keymaster {
namespace {

void dump_value(const keymaster_key_param_t& param) {
  switch (keymaster_tag_get_type(param.tag)) {
    case KM_INVALID:
      TRACE_DEBUG("    KM_INVALID");
      return;
    case KM_ENUM:
    case KM_ENUM_REP:
      TRACE_DEBUG("    KM_ENUM: %d", static_cast<int32_t>(param.enumerated));
      return;
    case KM_UINT:
    case KM_UINT_REP:
      TRACE_DEBUG("    KM_UINT: 0x%08x", param.integer);
      return;
    case KM_ULONG:
    case KM_ULONG_REP:
      TRACE_DEBUG("    KM_ULONG: 0x%016llx", static_cast<unsigned long long>(param.long_integer));
      return;
    case KM_DATE:
      TRACE_DEBUG("    KM_DATE: 0x%016llx", static_cast<unsigned long long>(param.date_time));
      return;
    case KM_BOOL:
      TRACE_DEBUG("    KM_BOOL: %d", param.boolean);
      return;
    case KM_BIGNUM:
      TRACE_DEBUG("    KM_BIGNUM, length %dB", param.blob.data_length);
      return;
    case KM_BYTES:
      TRACE_DEBUG("    KM_BYTES, length %dB", param.blob.data_length);
      return;
    default:
      TRACE_DEBUG("    Invalid tag type");
  }
}

}  // namespace

void _keymaster_dump_key_param_set(const char* file, int line, const keymaster_key_param_set_t& set) {
  TRACE_DEBUG("Dump at %s:%d", file, line);
  for (const keymaster_key_param_t& param : records(set)) {
    TRACE_DEBUG("Tag: 0x%08x", param.tag);
    dump_value(param);
  }
}

}  // namespace keymaster
