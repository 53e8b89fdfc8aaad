// Names of stored objects that are put together from text and numbers.
#ifndef TEE_COMPANIONS_COMMON_OBJECT_NAME_H_
#define TEE_COMPANIONS_COMMON_OBJECT_NAME_H_

#include <cstdint>
#include <string_view>

#include "tee_internal_api.h"

namespace keymaster::companion {

/// object_name collects a name of up to TEE_OBJECT_ID_MAX_LEN characters; what goes beyond is cut off.
class object_name {
 public:
  explicit object_name(std::string_view text) { add(text); }

  object_name& add(std::string_view text);
  object_name& add_hex(uint16_t number);      ///< as "%04x" has it
  object_name& add_decimal(uint32_t number);  ///< as "%u" has it

  [[nodiscard]] std::string_view view() const { return {text_, length_}; }

 private:
  char text_[TEE_OBJECT_ID_MAX_LEN] = {};
  uint32_t length_ = 0;
};

}  // namespace keymaster::companion

#endif  // TEE_COMPANIONS_COMMON_OBJECT_NAME_H_
