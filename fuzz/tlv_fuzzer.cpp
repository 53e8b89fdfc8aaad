// Boxes from any bytes, against a reader of the fuzzer's own: what parses, what is found in it, boxes in boxes, and the
// form of a box that is built from the same entries. Nothing stays on the heap, whatever finds no memory.
#include <algorithm>
#include <cstring>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "soter/tlv_box.h"

using namespace keymaster;

namespace fuzzing {
namespace {

constexpr int deepest_box = 6;

using entry = std::pair<std::uint16_t, bytes>;
using entries = std::map<std::uint16_t, bytes>;

/// All entries in order; nothing for bytes that end within one.
std::optional<std::vector<entry>> read_all(const bytes& data) {
  std::vector<entry> found;
  for (std::size_t at = 0; at < data.size();) {
    if (data.size() < at + 4) return std::nullopt;
    const auto tag = static_cast<std::uint16_t>(data[at] + 256 * data[at + 1]);
    const std::size_t length = data[at + 2] + 256U * data[at + 3];
    at += 4;
    if (data.size() < at + length) return std::nullopt;
    const auto value = data.begin() + static_cast<std::ptrdiff_t>(at);
    found.emplace_back(tag, bytes(value, value + static_cast<std::ptrdiff_t>(length)));
    at += length;
  }
  return found;
}

/// The first value of each tag.
std::optional<entries> read_entries(const bytes& data) {
  const auto all = read_all(data);
  if (!all) return std::nullopt;
  return entries(all->begin(), all->end());
}

tlv_box_owner parse(const bytes& data) {
  // A block of exactly its size, which is gone when the box is asked.
  const std::unique_ptr<std::uint8_t[]> block(new std::uint8_t[data.size()]);
  std::copy(data.begin(), data.end(), block.get());
  return tlv_box_owner{tlv_box_parse(block.get(), static_cast<std::uint32_t>(data.size()))};
}

template <class Number>
void check_number(int (*get)(const tlv_box*, std::uint16_t, Number*), const tlv_box* box, std::uint16_t tag,
                  const bytes* value) {
  std::uint8_t expected[sizeof(Number)], got[sizeof(Number)];
  std::memset(expected, value == nullptr ? 0xA5 : 0, sizeof expected);
  if (value != nullptr) std::copy_n(value->begin(), std::min(value->size(), sizeof expected), expected);
  Number number;
  std::memset(&number, 0xA5, sizeof number);
  require(get(box, tag, &number) == (value == nullptr ? -1 : 0), "a number is found where its tag is");
  std::memcpy(got, &number, sizeof got);
  require(std::ranges::equal(got, expected), "a number is the start of its value, and zero behind it");
}

void check_numbers(const tlv_box* box, std::uint16_t tag, const bytes* value) {
  check_number(tlv_box_get_char, box, tag, value);
  check_number(tlv_box_get_short, box, tag, value);
  check_number(tlv_box_get_int, box, tag, value);
  check_number(tlv_box_get_long, box, tag, value);
  check_number(tlv_box_get_longlong, box, tag, value);
  check_number(tlv_box_get_float, box, tag, value);
  check_number(tlv_box_get_double, box, tag, value);
}

void check_bytes(const tlv_box* box, std::uint16_t tag, const bytes* value, std::size_t capacity) {
  bytes room(capacity, 0xA5), expected = room;
  auto length = static_cast<std::uint32_t>(capacity);
  const bool fits = value != nullptr && value->size() <= capacity;
  if (fits) {
    std::ranges::fill(expected, 0);
    std::ranges::copy(*value, expected.begin());
  }
  require((tlv_box_get_bytes(box, tag, room.data(), &length) == 0) == fits, "a value is copied where it fits");
  require(length == (fits ? value->size() : capacity) && room == expected, "a value comes whole, or not at all");
  std::string text(capacity, '\xA5');
  length = static_cast<std::uint32_t>(capacity);
  require((tlv_box_get_string(box, tag, text.data(), &length) == 0) == fits &&
              std::ranges::equal(text, expected, {}, [](char c) { return static_cast<std::uint8_t>(c); }),
          "a text is copied as bytes are");
}

void check_view(const tlv_box* box, std::uint16_t tag, const bytes* value) {
  const std::uint8_t* view = nullptr;
  std::uint32_t length = 0;
  const bool found = tlv_box_get_bytes_ptr(box, tag, &view, &length) == 0;
  require(found == (value != nullptr), "a value is shown where its tag is");
  require(!found || std::ranges::equal(std::span(view, length), *value), "a value is shown as it was stored");
}

void check_box(const bytes& data, input_reader& choices, int depth);

void check_entry(const tlv_box* box, std::uint16_t tag, const bytes* value, input_reader& choices, int depth) {
  check_numbers(box, tag, value);
  check_view(box, tag, value);
  for (const std::size_t capacity : {value == nullptr ? 3 : value->size(), choices.below(64)}) {
    check_bytes(box, tag, value, capacity);
    if (capacity != 0) check_bytes(box, tag, value, capacity - 1);
  }
  tlv_box* made = nullptr;
  const bool is_box = tlv_box_get_object(box, tag, &made) == 0;
  const tlv_box_owner inner{made};
  require(is_box == static_cast<bool>(inner), "a box within a box is there, or is not");
  require(is_box == (value != nullptr && read_entries(*value).has_value()), "a value is a box, or is not");
  if (is_box && depth < deepest_box) check_box(*value, choices, depth + 1);
}

/// The same entries, put in by order of their tags.
void check_rebuilt(const entries& all) {
  const tlv_box_owner box{tlv_box_create()};
  bytes expected;
  for (const auto& [tag, value] : all) {
    const auto length = static_cast<std::uint32_t>(value.size());
    require(tlv_box_put_bytes(box.get(), tag, value.data(), length) == 0, "an entry is put in");
    require(tlv_box_putobject(box.get(), tag, "other", 5) == -1, "a second put of a tag is refused");
    bytes form = {static_cast<std::uint8_t>(tag), static_cast<std::uint8_t>(tag >> 8),
                  static_cast<std::uint8_t>(length), static_cast<std::uint8_t>(length >> 8)};
    form.insert(form.end(), value.begin(), value.end());
    expected.insert(expected.begin(), form.begin(), form.end());
  }
  require(tlv_box_get_size(box.get()) == expected.size() && tlv_box_get_buffer(box.get()) == nullptr,
          "a box knows its size before its form");
  require(tlv_box_serialize(box.get()) == 0, "a box that was built serializes");
  require(std::ranges::equal(std::span(tlv_box_get_buffer(box.get()), tlv_box_get_size(box.get())), expected),
          "a box serializes in the reverse order of the puts");
  require(tlv_box_serialize(box.get()) == -1, "a box serializes once");
  const tlv_box_owner outer{tlv_box_create()};
  if (tlv_box_put_object(outer.get(), 1, box.get()) == 0) check_view(outer.get(), 1, &expected);
  require(read_entries(expected) == all, "the form of a box has the same entries");
}

void check_box(const bytes& data, input_reader& choices, int depth) {
  const std::optional<entries> expected = read_entries(data);
  const tlv_box_owner box = parse(data);
  require(static_cast<bool>(box) == expected.has_value(), "whole entries parse, and nothing else");
  if (!box) return;
  require(std::ranges::equal(std::span(tlv_box_get_buffer(box.get()), tlv_box_get_size(box.get())), data),
          "a parsed box keeps its form");
  require(box.get()->entries->count == expected->size(), "a box has each tag once");
  for (const auto& [tag, value] : *expected) check_entry(box.get(), tag, &value, choices, depth);
  const auto absent = static_cast<std::uint16_t>(choices.number(2));
  if (!expected->contains(absent)) check_entry(box.get(), absent, nullptr, choices, depth);
  require(tlv_box_putobject(box.get(), absent, "x", 1) == -1, "a parsed box is frozen");
  require(tlv_box_serialize(box.get()) == -1, "a parsed box is frozen");
  if (depth == 0) check_rebuilt(*expected);
}

/// Where memory is wanted there is no box, or one that misses an entry: then another value of its tag is the first.
void check_want_of_memory(const bytes& data) {
  const auto all = read_all(data);
  const tlv_box_owner box = parse(data);
  if (!box) return;
  require(all.has_value(), "whole entries parse, and nothing else");
  const entries expected(all->begin(), all->end());
  require(box.get()->entries->count + 1 >= expected.size(), "one fault costs one entry");
  std::size_t others = 0;
  for (const auto& [tag, value] : expected) {
    const std::uint8_t* view = nullptr;
    std::uint32_t length = 0;
    if (tlv_box_get_bytes_ptr(box.get(), tag, &view, &length) != 0) continue;
    const entry found = {tag, bytes(view, view + length)};
    others += found.second == value ? 0 : 1;
    require(std::ranges::find(*all, found) != all->end(), "what is found was stored");
  }
  require(others + expected.size() - box.get()->entries->count <= 1, "one fault costs one entry");
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance& instance) {
    input_reader in({data, size});
    const std::size_t fault = in.below(64);
    const bytes chosen = in.take(8), rest = in.take(size);
    input_reader choices(chosen);
    if (fault < 32) {
      check_box(rest, choices, 0);
      return;
    }
    instance.faults.clear();
    instance.faults.fail_allocation(static_cast<std::uint32_t>(fault - 31));
    check_want_of_memory(rest);
    instance.faults.clear();
  });
  return 0;
}
