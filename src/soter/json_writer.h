// JSON objects, built member by member and written without any whitespace. What is written is signed, so every byte of
// it is fixed: members stay in the order in which they were set, and '/' is escaped.
//
// Results are 0 and -1; nothing is traced. -1 means a null argument, want of memory, or what a function says beside.
#ifndef KEYMASTER_SOTER_JSON_WRITER_H_
#define KEYMASTER_SOTER_JSON_WRITER_H_

#include <cstdint>

namespace keymaster {

struct json_value;
struct json_object;

/// json_value_init_object makes an object without members. Null: out of memory.
[[nodiscard]] json_value* json_value_init_object();

/// json_value_get_object answers the object of an object value, which owns it; null for another value.
[[nodiscard]] json_object* json_value_get_object(json_value* value);

/// json_object_set_string sets a member to a copy of `string`. -1: the string is not UTF-8, or as
/// json_object_set_value.
[[nodiscard]] int json_object_set_string(json_object* object, const char* name, const char* string);

/// json_object_set_number sets a member to a number.
[[nodiscard]] int json_object_set_number(json_object* object, const char* name, double number);

/// json_object_set_value sets a member to a value, which the object owns from then on; a member of the name gives up
/// its old value and keeps its place. -1: the object holds 960 members; the value stays the caller's, and the object as
/// it was.
[[nodiscard]] int json_object_set_value(json_object* object, const char* name, json_value* value);

/// json_serialization_size answers the bytes of the text with its NUL. 0: a number in it has no text.
[[nodiscard]] uint32_t json_serialization_size(const json_value* value);

/// json_serialize_to_buffer writes the text and its NUL. -1: it has none, or `capacity` is too small for it.
[[nodiscard]] int json_serialize_to_buffer(const json_value* value, char* buffer, uint32_t capacity);

/// json_serialize_to_string makes the text; json_free_serialized_string wipes and frees it. Null: out of memory, or
/// there is no text.
[[nodiscard]] char* json_serialize_to_string(const json_value* value);
void json_free_serialized_string(char* string);

/// json_value_free frees a value with all that it holds; null is allowed.
void json_value_free(json_value* value);

/// json_root owns a value.
class json_root {
 public:
  explicit json_root(json_value* value) : value_(value) {}
  json_root(const json_root&) = delete;
  json_root& operator=(const json_root&) = delete;
  ~json_root() { json_value_free(value_); }
  [[nodiscard]] json_value* get() const { return value_; }

 private:
  json_value* value_;
};

/// json_text owns a serialized text.
class json_text {
 public:
  explicit json_text(char* text) : text_(text) {}
  json_text(const json_text&) = delete;
  json_text& operator=(const json_text&) = delete;
  ~json_text() { json_free_serialized_string(text_); }
  [[nodiscard]] const char* get() const { return text_; }
  [[nodiscard]] explicit operator bool() const { return text_ != nullptr; }

 private:
  char* text_;
};

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_JSON_WRITER_H_
