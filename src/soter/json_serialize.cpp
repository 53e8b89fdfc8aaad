#include <array>

#include "soter/json_number.h"
#include "soter/json_value.h"

namespace keymaster {
namespace {

/// Takes the text piece by piece and counts it. Without a buffer it only counts.
class json_output {
 public:
  json_output(char* buffer, uint64_t capacity) : buffer_(buffer), capacity_(capacity) {}

  void put(const char* bytes, uint32_t length) {
    if (buffer_ != nullptr) {
      if (length > capacity_ - length_) return fail();
      std::memcpy(buffer_ + length_, bytes, length);
    }
    length_ += length;
  }
  void put(char character) { put(&character, 1); }
  void fail() { failed_ = true; }

  [[nodiscard]] bool failed() const { return failed_; }
  [[nodiscard]] uint64_t length() const { return length_; }

 private:
  char* buffer_;
  uint64_t capacity_;
  uint64_t length_ = 0;
  bool failed_ = false;
};

struct escape_row {
  char character;
  char letter;
};

/// What is escaped, by a backslash and a letter. The slash is among it, and control characters without a letter are
/// not: the signatures cover the text as it always was.
constexpr std::array<escape_row, 8> escapes = {{
    {'"', '"'},
    {'\\', '\\'},
    {'/', '/'},
    {'\b', 'b'},
    {'\f', 'f'},
    {'\n', 'n'},
    {'\r', 'r'},
    {'\t', 't'},
}};

void write_character(json_output& out, char character) {
  for (const escape_row& escape : escapes) {
    if (escape.character != character) continue;
    out.put('\\');
    out.put(escape.letter);
    return;
  }
  out.put(character);
}

void write_string(json_output& out, const char* text) {
  out.put('"');
  for (; *text != '\0'; ++text) write_character(out, *text);
  out.put('"');
}

void write_number(json_output& out, double number) {
  const json_number_text text = json_format_number(number);
  if (text.length == 0) out.fail();
  out.put(text.text, text.length);
}

/// Writes a string or a number, or the beginning of an object.
void begin_value(json_output& out, const json_value& value) {
  switch (value.kind) {
    case json_kind::object:
      return out.put('{');
    case json_kind::string:
      return write_string(out, reinterpret_cast<const char*>(value.text.data()));
    case json_kind::number:
      return write_number(out, value.number);
  }
}

/// Which member of its parent a value is.
uint32_t place_of(const json_value* value) {
  uint32_t i = 0;
  while (value->parent->object.value(i) != value) ++i;
  return i;
}

/// Writes `root` with all that is in it, going up from an object's end by the links to the parents.
void write_value(json_output& out, const json_value* root) {
  begin_value(out, *root);
  if (root->kind != json_kind::object) return;
  const json_value* at = root;
  uint32_t next = 0;  // the member of `at` that comes next
  while (true) {
    if (next < at->object.count) {
      if (next != 0) out.put(',');
      write_string(out, at->object.name(next));
      out.put(':');
      const json_value* const member = at->object.value(next++);
      begin_value(out, *member);
      if (member->kind != json_kind::object) continue;
      at = member;
      next = 0;
    } else {
      out.put('}');
      if (at == root) return;
      next = place_of(at) + 1;
      at = at->parent;
    }
  }
}

}  // namespace

uint32_t json_serialization_size(const json_value* value) {
  if (value == nullptr) return 0;
  json_output counted{nullptr, 0};
  write_value(counted, value);
  return counted.failed() || counted.length() >= UINT32_MAX ? 0 : static_cast<uint32_t>(counted.length()) + 1;
}

int json_serialize_to_buffer(const json_value* value, char* buffer, uint32_t capacity) {
  const uint32_t size = json_serialization_size(value);
  if (buffer == nullptr || size == 0 || size > capacity) return -1;
  json_output out{buffer, capacity};
  write_value(out, value);
  out.put('\0');
  return out.failed() ? -1 : 0;
}

char* json_serialize_to_string(const json_value* value) {
  const uint32_t size = json_serialization_size(value);
  secret_bytes text;
  if (size == 0 || !text.allocate(size)) return nullptr;
  auto* const characters = reinterpret_cast<char*>(text.data());
  if (json_serialize_to_buffer(value, characters, size) != 0) return nullptr;
  (void)text.release();
  return characters;
}

}  // namespace keymaster
