#include "client/lib/factory_record.h"

#include <array>
#include <nlohmann/json.hpp>
#include <set>

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

using json = nlohmann::ordered_json;

struct text_member {
  const char* name;
  std::string factory_record::*text;
};

constexpr const char* device_id_name = "device_id";
constexpr std::array text_members = std::to_array<text_member>({{"cpu_id", &factory_record::cpu_id},
                                                                {"tee_n", &factory_record::tee_n},
                                                                {"tee_v", &factory_record::tee_v},
                                                                {"fp_n", &factory_record::fp_n},
                                                                {"fp_v", &factory_record::fp_v},
                                                                {"attk", &factory_record::attk}});

constexpr std::string_view hex_digits = "0123456789abcdef";

std::string to_hex(byte_view data) {
  std::string text;
  for (const std::uint8_t byte : data) {
    text += hex_digits[byte >> 4U];
    text += hex_digits[byte & 0xFU];
  }
  return text;
}

std::uint8_t value_of_digit(char digit) {
  const std::size_t value = hex_digits.find(digit);
  if (value == std::string_view::npos) {
    throw format_error("the device id of a factory record is written in lower-case hexadecimal digits");
  }
  return static_cast<std::uint8_t>(value);
}

bytes from_hex(const std::string& text) {
  if (text.size() % 2 != 0) {
    throw format_error("the device id of a factory record has half a byte");
  }
  bytes data;
  for (std::size_t i = 0; i < text.size(); i += 2) {
    data.push_back(static_cast<std::uint8_t>(value_of_digit(text[i]) << 4U | value_of_digit(text[i + 1])));
  }
  return data;
}

/// JSON as it is read has the last of two members of a name, and a record that says two things says nothing.
json parse_once(byte_view file) {
  std::vector<std::set<std::string>> names;
  const auto look = [&](int depth, json::parse_event_t event, json& parsed) {
    if (event == json::parse_event_t::object_start) {
      names.resize(static_cast<std::size_t>(depth) + 1);
      names.back().clear();
    } else if (event == json::parse_event_t::key && !names.back().insert(parsed.get<std::string>()).second) {
      throw format_error("the factory record has the member " + parsed.get<std::string>() + " twice");
    }
    return true;
  };
  try {
    return json::parse(file.begin(), file.end(), look);
  } catch (const json::exception& fault) {
    throw format_error(std::string("the factory record is not JSON: ") + fault.what());
  }
}

std::string text_of(const json& object, const char* name) {
  const auto member = object.find(name);
  if (member == object.end() || !member->is_string()) {
    throw format_error(std::string("the factory record has no text ") + name);
  }
  auto text = member->get<std::string>();
  if (text.find('\0') != std::string::npos) {
    throw format_error(std::string("the text ") + name + " of the factory record holds a NUL");
  }
  return text;
}

}  // namespace

std::string write_factory_record(const factory_record& record) {
  json object = {{device_id_name, to_hex(record.device_id)}};
  for (const text_member& member : text_members) {
    object[member.name] = record.*member.text;
    (void)text_of(object, member.name);
  }
  try {
    return object.dump(2) + "\n";
  } catch (const json::exception&) {
    throw format_error("a text of the factory record is not UTF-8");
  }
}

factory_record read_factory_record(byte_view file) {
  const json object = parse_once(file);
  if (!object.is_object()) {
    throw format_error("the factory record is not a JSON object");
  }
  factory_record record;
  record.device_id = from_hex(text_of(object, device_id_name));
  for (const text_member& member : text_members) {
    record.*member.text = text_of(object, member.name);
  }
  if (object.size() != text_members.size() + 1) {
    throw format_error("the factory record has members that do not belong there");
  }
  return record;
}

}  // namespace keymaster::client
