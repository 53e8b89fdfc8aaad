#include "client/kmctl/describe.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <vector>

#include "client/kmctl/values.h"
#include "client/lib/names.h"

namespace kmctl {
namespace {

using keymaster::client::authorization;
using keymaster::client::authorizations;
using keymaster::client::find_tag;
using keymaster::client::tag_name;
using keymaster::client::tag_type;
using json = nlohmann::ordered_json;

bool may_repeat(keymaster::keymaster_tag_t tag) {
  const auto type = tag_type(tag);
  return type == keymaster::KM_ENUM_REP || type == keymaster::KM_UINT_REP || type == keymaster::KM_ULONG_REP;
}

std::string title_of(keymaster::keymaster_tag_t tag) {
  const tag_name* const row = find_tag(tag);
  return row == nullptr ? fmt::format("tag-0x{:08x}", tag) : std::string(row->name);
}

/// A key's blob inside another key's characteristics is long, and says nothing to anybody but the TA.
bool holds_blob(keymaster::keymaster_tag_t tag) {
  return tag == keymaster::KM_TAG_SOTER_SIGNING_KEY_BLOB || tag == keymaster::KM_TAG_SOTER_SIGNING_KEY_NAME;
}

json value_of(const authorization& one) {
  if (holds_blob(one.tag)) {
    return {{"size", one.blob.size()}};
  }
  if (keymaster::client::holds_bytes(one.tag)) {
    return to_hex(one.blob);
  }
  if (tag_type(one.tag) == keymaster::KM_BOOL) {
    return one.number != 0;
  }
  if (tag_type(one.tag) == keymaster::KM_DATE) {
    return format_date(one.number);
  }
  if (const tag_name* const row = find_tag(one.tag); row != nullptr && !row->values.empty()) {
    return keymaster::client::name_of(row->values, one.number);
  }
  return one.number;
}

std::string text_of(const json& value) {
  if (value.is_boolean()) {
    return value.get<bool>() ? "yes" : "no";
  }
  if (value.is_object()) {
    return format_size(value["size"].get<std::uint64_t>());
  }
  return value.is_string() ? value.get<std::string>() : value.dump();
}

/// The tags of a list, each once, in the order of their first values.
std::vector<keymaster::keymaster_tag_t> tags_of(const authorizations& list) {
  std::vector<keymaster::keymaster_tag_t> tags;
  for (const authorization& one : list) {
    if (std::ranges::find(tags, one.tag) == tags.end()) {
      tags.push_back(one.tag);
    }
  }
  return tags;
}

}  // namespace

json describe_json(const authorizations& list) {
  json object = json::object();
  for (const auto tag : tags_of(list)) {
    std::string name = title_of(tag);
    std::ranges::replace(name, '-', '_');
    json values = json::array();
    for (const authorization& one : list) {
      if (one.tag == tag) {
        values.push_back(value_of(one));
      }
    }
    object[name] = values.size() == 1 && !may_repeat(tag) ? values.front() : values;
  }
  return object;
}

std::string describe_text(const authorizations& list, std::size_t indent) {
  std::string text;
  for (const auto tag : tags_of(list)) {
    std::string values;
    for (const authorization& one : list) {
      if (one.tag == tag) {
        values += values.empty() ? "" : ", ";
        values += text_of(value_of(one));
      }
    }
    text += fmt::format("{}{: <{}}{:<28}{}", text.empty() ? "" : "\n", "", indent, title_of(tag), values);
  }
  return text;
}

std::string key_title(const authorizations& list) {
  const auto algorithm = list.unique_number(keymaster::KM_TAG_ALGORITHM);
  std::string title =
      algorithm ? keymaster::client::name_of(keymaster::client::algorithm_names, *algorithm) : "unknown";
  std::ranges::transform(title, title.begin(), [](unsigned char c) { return static_cast<char>(std::toupper(c)); });
  const auto size = list.unique_number(keymaster::KM_TAG_KEY_SIZE);
  return size ? fmt::format("{}-{}", title, *size) : title;
}

}  // namespace kmctl
