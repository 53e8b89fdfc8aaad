// The values behind json_writer.h, for the two modules that make and write them.
#ifndef KEYMASTER_SOTER_JSON_VALUE_H_
#define KEYMASTER_SOTER_JSON_VALUE_H_

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "platform/bytes.h"
#include "soter/json_writer.h"

namespace keymaster {

enum class json_kind { object, string, number };

/// Members in the order in which they were set, in two arrays side by side. Both arrays are heap blocks of `capacity`
/// pointers; names and values are owned.
struct json_object {
  heap_bytes names;
  heap_bytes values;
  uint32_t count = 0;
  uint32_t capacity = 0;
  json_value* owner = nullptr;  // the value whose object this is

  [[nodiscard]] char* name(uint32_t i) const { return slot<char>(names, i); }
  [[nodiscard]] json_value* value(uint32_t i) const { return slot<json_value>(values, i); }
  void set_name(uint32_t i, char* name) { std::memcpy(names.data() + offset(i), &name, slot_size); }
  void set_value(uint32_t i, json_value* value) { std::memcpy(values.data() + offset(i), &value, slot_size); }

  static constexpr uint32_t slot_size = sizeof(void*);

 private:
  static std::size_t offset(uint32_t i) { return std::size_t{i} * slot_size; }
  template <class Pointee>
  static Pointee* slot(const heap_bytes& array, uint32_t i) {
    Pointee* pointer = nullptr;
    std::memcpy(&pointer, array.data() + offset(i), slot_size);
    return pointer;
  }
};

struct json_value {
  json_kind kind = json_kind::object;
  json_object object;
  secret_bytes text;  // of a string, with its NUL
  double number = 0;
  json_value* parent = nullptr;  // the object value that this is a member of
};

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_JSON_VALUE_H_
