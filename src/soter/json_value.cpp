#include "soter/json_value.h"

#include <algorithm>

#include "soter/text.h"

namespace keymaster {
namespace {

constexpr uint32_t start_capacity = 15;
/// An object of this capacity or more grows no further: 15, 30, 60 and so on, so that 960 members is the most.
constexpr uint32_t capacity_ceiling = 961;

bool copy_text(const char* text, secret_bytes& copy) {
  const std::span<const uint8_t> bytes = text_bytes(text);
  return copy.copy_of({bytes.data(), bytes.size() + 1});
}

/// Copies the pointers of `array` into one of `capacity`.
bool grow(const heap_bytes& array, uint32_t capacity, heap_bytes& larger) {
  if (!larger.allocate(capacity * json_object::slot_size)) return false;
  if (array) std::memcpy(larger.data(), array.data(), array.size());
  return true;
}

bool make_room(json_object& object) {
  if (object.count < object.capacity) return true;
  const uint32_t capacity = std::max(object.capacity * 2, start_capacity);
  if (capacity >= capacity_ceiling) return false;
  heap_bytes names, values;
  if (!grow(object.names, capacity, names) || !grow(object.values, capacity, values)) return false;
  object.names = std::move(names);
  object.values = std::move(values);
  object.capacity = capacity;
  return true;
}

int append(json_object& object, const char* name, json_value* value) {
  secret_bytes copy;
  if (!copy_text(name, copy) || !make_room(object)) return -1;
  object.set_name(object.count, reinterpret_cast<char*>(copy.release()));
  object.set_value(object.count, value);
  ++object.count;
  return 0;
}

bool same_text(const char* a, const char* b) {
  for (; *a != '\0' && *a == *b; ++b) ++a;
  return *a == *b;
}

/// Takes the last member out of an object.
json_value* take_last(json_object& object) {
  --object.count;
  char* const text = object.name(object.count);
  secret_bytes name;
  name.adopt(reinterpret_cast<uint8_t*>(text), text_length(text));
  return object.value(object.count);
}

}  // namespace

json_value* json_value_init_object() {
  auto* const value = new_record<json_value>();
  if (value != nullptr) value->object.owner = value;
  return value;
}

json_object* json_value_get_object(json_value* value) {
  return value != nullptr && value->kind == json_kind::object ? &value->object : nullptr;
}

int json_object_set_value(json_object* object, const char* name, json_value* value) {
  if (object == nullptr || name == nullptr || value == nullptr) return -1;
  for (uint32_t i = 0; i < object->count; ++i) {
    if (!same_text(object->name(i), name)) continue;
    json_value_free(object->value(i));
    object->set_value(i, value);
    value->parent = object->owner;
    return 0;
  }
  if (append(*object, name, value) != 0) return -1;
  value->parent = object->owner;
  return 0;
}

int json_object_set_string(json_object* object, const char* name, const char* string) {
  if (string == nullptr || !is_utf8(text_bytes(string))) return -1;
  auto* const value = new_record<json_value>();
  if (value == nullptr) return -1;
  value->kind = json_kind::string;
  if (copy_text(string, value->text) && json_object_set_value(object, name, value) == 0) return 0;
  json_value_free(value);
  return -1;
}

int json_object_set_number(json_object* object, const char* name, double number) {
  auto* const value = new_record<json_value>();
  if (value == nullptr) return -1;
  value->kind = json_kind::number;
  value->number = number;
  if (json_object_set_value(object, name, value) == 0) return 0;
  json_value_free(value);
  return -1;
}

// Goes down to what has no members and up again: the stack is small, and no depth can exhaust it this way.
void json_value_free(json_value* value) {
  if (value == nullptr) return;
  value->parent = nullptr;
  while (value != nullptr) {
    if (value->object.count != 0) {
      value = take_last(value->object);
      continue;
    }
    json_value* const parent = value->parent;
    delete_record(value);
    value = parent;
  }
}

void json_free_serialized_string(char* string) {
  if (string == nullptr) return;
  secret_bytes owner;
  owner.adopt(reinterpret_cast<uint8_t*>(string), text_length(string));
}

}  // namespace keymaster
