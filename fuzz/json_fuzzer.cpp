// Objects built from any names, strings and numbers, against a writer of the fuzzer's own: what can be set, the bytes
// of the text, its size and its place in buffers of any size. Want of memory changes nothing, and nothing stays.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "soter/json_writer.h"
#include "tests/support/utf8_decoder.h"

using namespace keymaster;

namespace fuzzing {
namespace {

constexpr std::size_t deepest_object = 8;

/// A value as the fuzzer has it: an object, or its text in full. A number that has none is `untold`.
struct value_model {
  std::string text;
  bool is_object = false;
  bool untold = false;
  std::vector<std::string> names;
  std::vector<value_model> values;
};

std::string quoted(const std::string& text) {
  constexpr std::string_view plain = "\"\\/\b\f\n\r\t", letters = "\"\\/bfnrt";
  std::string result = "\"";
  for (const char character : text) {
    const std::size_t place = plain.find(character);
    if (place == std::string_view::npos) {
      result += character;
    } else {
      result += '\\';
      result += letters[place];
    }
  }
  return result + '"';
}

value_model number_model(double number) {
  value_model made;
  char text[400] = "";
  const bool in_range = number >= -9223372036854775808.0 && number < 9223372036854775808.0;
  const bool whole = in_range && std::trunc(number) == number;
  if (whole) {
    made.untold = std::snprintf(text, sizeof text, "%lld", static_cast<long long>(number)) > 11;
  } else {
    made.untold = !std::isfinite(number) || std::snprintf(text, sizeof text, "%f", number) > 29;
  }
  made.text = text;
  return made;
}

/// Writes the text; false when a number in it has none.
bool write(const value_model& value, std::string& text) {
  if (!value.is_object) {
    text += value.text;
    return !value.untold;
  }
  bool told = true;
  text += '{';
  for (std::size_t i = 0; i < value.names.size(); ++i) {
    if (i != 0) text += ',';
    text += quoted(value.names[i]) + ':';
    told = write(value.values[i], text) && told;
  }
  text += '}';
  return told;
}

void set_model(value_model& object, const std::string& name, value_model value) {
  const auto same = std::ranges::find(object.names, name);
  if (same != object.names.end()) {
    object.values[static_cast<std::size_t>(same - object.names.begin())] = std::move(value);
    return;
  }
  object.names.push_back(name);
  object.values.push_back(std::move(value));
}

/// Bytes up to the first NUL, as C has texts.
std::string read_text(input_reader& in, std::size_t most) {
  const bytes taken = in.take(in.below(most));
  return {taken.begin(), std::ranges::find(taken, std::uint8_t{0})};
}

double read_number(input_reader& in) {
  switch (in.below(4)) {
    case 0:
      return static_cast<double>(in.u32());
    case 1:
      return static_cast<double>(static_cast<std::int64_t>(in.number(6)) - 70'000'000'000'000);
    case 2:
      return static_cast<double>(static_cast<std::int32_t>(in.u32())) / 128;
    default: {
      const std::uint64_t bits = in.number(8);
      double number = 0;
      std::memcpy(&number, &bits, sizeof number);
      return number;
    }
  }
}

bool is_text(const std::string& text) {
  return testing_support::is_well_formed_utf8({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
}

class object_builder {
 public:
  object_builder(hosted_tee::instance& instance, input_reader& in) : faults_(instance.faults), in_(in) {}

  void fill(json_object* object, value_model& model, std::size_t depth) {
    for (std::size_t count = in_.below(20); count > 0 && !in_.empty(); --count) set(object, model, depth);
  }

 private:
  void set(json_object* object, value_model& model, std::size_t depth) {
    const std::string name = read_text(in_, 6);
    const std::size_t kind = in_.below(8);
    const bool fault = in_.below(16) == 15;
    if (fault) faults_.fail_allocation(static_cast<std::uint32_t>(1 + in_.below(6)));
    if (kind < 4) {
      const std::string text = read_text(in_, 40);
      value_model value;
      value.text = quoted(text);
      settle(json_object_set_string(object, name.c_str(), text.c_str()), is_text(text), model, name, std::move(value));
    } else if (kind < 7) {
      const double number = read_number(in_);
      settle(json_object_set_number(object, name.c_str(), number), true, model, name, number_model(number));
    } else if (depth < deepest_object) {
      set_object(object, model, name, depth);
    }
    faults_.clear();
  }

  void set_object(json_object* object, value_model& model, const std::string& name, std::size_t depth) {
    json_value* const inner = json_value_init_object();
    value_model value;
    value.is_object = true;
    const bool made = inner != nullptr;
    require(made || faults_.triggered(), "an object is made");
    const int rc = made ? json_object_set_value(object, name.c_str(), inner) : -1;
    if (rc != 0) json_value_free(inner);
    faults_.clear();
    if (rc != 0) return;
    fill(json_value_get_object(inner), value, depth + 1);
    set_model(model, name, std::move(value));
  }

  void settle(int rc, bool allowed, value_model& model, const std::string& name, value_model value) {
    const bool wanted = faults_.triggered();
    require(allowed || rc == -1, "what is no text is not set");
    require(rc == 0 || !allowed || wanted, "a text and a number are set");
    if (rc == 0) set_model(model, name, std::move(value));
  }

  hosted_tee::fault_plan& faults_;
  input_reader& in_;
};

void check_buffer(const json_value* root, const std::string& expected, bool told, std::size_t capacity) {
  // A block of exactly its size: the sanitizer sees a byte too much.
  const std::unique_ptr<char[]> room(new char[capacity]);
  std::fill_n(room.get(), capacity, '\xA5');
  const bool fits = told && expected.size() + 1 <= capacity;
  const int rc = json_serialize_to_buffer(root, room.get(), static_cast<std::uint32_t>(capacity));
  require((rc == 0) == fits, "a text is written where it fits");
  const std::string_view written(room.get(), capacity);
  require(!fits || written.starts_with(std::string_view(expected.c_str(), expected.size() + 1)),
          "a text is written byte by byte");
  const std::size_t end = fits ? expected.size() + 1 : 0;
  require(written.find_first_not_of('\xA5', end) == std::string_view::npos, "nothing is written behind a text");
}

void check_text(hosted_tee::fault_plan& faults, const json_value* root, const value_model& model, std::size_t other) {
  std::string expected;
  const bool told = write(model, expected);
  require(json_serialization_size(root) == (told ? expected.size() + 1 : 0), "a text is as long as announced");
  for (const std::size_t capacity : {expected.size() + 2, expected.size() + 1, expected.size(), other}) {
    check_buffer(root, expected, told, capacity);
  }
  const json_text text{json_serialize_to_string(root)};
  require(static_cast<bool>(text) == told, "an object whose numbers have texts has one");
  require(!told || expected == text.get(), "a text is the one that another writer writes");
  faults.fail_allocation(1);
  require(json_serialize_to_string(root) == nullptr, "a text needs memory");
  faults.clear();
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance& instance) {
    input_reader in({data, size});
    const std::size_t other = in.number(2) % 2048;
    instance.faults.clear();
    const json_root root{json_value_init_object()};
    value_model model;
    model.is_object = true;
    object_builder(instance, in).fill(json_value_get_object(root.get()), model, 0);
    check_text(instance.faults, root.get(), model, other);
  });
  return 0;
}
