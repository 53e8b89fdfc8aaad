#include "client/lib/statement.h"

#include <algorithm>
#include <array>
#include <limits>

#include "client/lib/statement_text.h"
#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

constexpr std::array<std::string_view, 17> check_names = {
    "layout", "shape", "signature", "encoding", "json",  "form", "members", "pub_key", "counter",
    "raw",    "fid",   "uid",       "tee_n",    "tee_v", "fp_n", "fp_v",    "cpu_id"};
static_assert(static_cast<std::size_t>(statement_check::cpu_id) == check_names.size() - 1);

constexpr std::string_view sign_beginning = "{\"raw\":";

/// The members of a statement front to back. Every one that is not as it must be is a refusal.
class member_reader {
 public:
  explicit member_reader(std::vector<statement_member> members) : members_(std::move(members)) {}

  [[nodiscard]] bool next_is(std::string_view name) const {
    return next_ < members_.size() && members_[next_].name == name;
  }

  std::uint64_t number(std::string_view name, std::uint64_t largest = std::numeric_limits<std::uint64_t>::max()) {
    const auto value = take<std::uint64_t>(name, "a number");
    if (value > largest) {
      refuse(std::string(name) + " is the number " + std::to_string(value) + ", which is too large");
    }
    return value;
  }
  std::optional<std::uint64_t> optional_number(std::string_view name, std::uint64_t largest) {
    return next_is(name) ? std::optional(number(name, largest)) : std::nullopt;
  }
  std::string text(std::string_view name) { return take<std::string>(name, "a text"); }

  void expect_end() const {
    if (next_ != members_.size()) {
      refuse("others follow the last that belongs there");
    }
  }

 private:
  [[noreturn]] static void refuse(const std::string& why) {
    throw statement_refused(statement_check::members, "the members of the statement are wrong: " + why);
  }
  template <class Value>
  Value take(std::string_view name, const char* kind) {
    if (!next_is(name)) {
      refuse(std::string(name) + " is missing where it must stand");
    }
    Value* const value = std::get_if<Value>(&members_[next_].value);
    if (value == nullptr) {
      refuse(std::string(name) + " is not " + kind);
    }
    ++next_;
    return std::move(*value);
  }

  std::vector<statement_member> members_;
  std::size_t next_ = 0;
};

const char* describe(std::optional<statement_kind> kind) {
  if (!kind) {
    return "it ends as no statement does";
  }
  return *kind == statement_kind::sign ? "it is a sign statement" : "it is an export statement";
}

[[noreturn]] void refuse_layout(byte_view statement, const std::string& why) {
  throw statement_refused(statement_check::layout, "these " + std::to_string(statement.size()) +
                                                       " bytes are no statement of this signer: " + why);
}

/// A statement with a signature of any size.
statement_parts split_anywhere(byte_view statement) {
  constexpr std::size_t length_size = 4;
  if (statement.size() < length_size) {
    refuse_layout(statement, "they end within the length of the text");
  }
  byte_reader in{statement};
  const std::size_t length = in.read_u32();
  if (length > in.remaining()) {
    refuse_layout(statement, "they end within a text of " + std::to_string(length) + " bytes");
  }
  const byte_view text = in.read_bytes(length);
  return {.text = text, .signature = in.read_bytes(in.remaining())};
}

void check_kind(byte_view text, statement_kind asked) {
  if (const auto found = kind_of(text); found != asked) {
    throw statement_refused(statement_check::shape,
                            std::string("the statement is not of the kind that was asked for: ") + describe(found));
  }
}

/// The text of a statement whose signature is the signer's, as JSON without the NUL of a sign statement.
std::string_view signed_text(byte_view statement, statement_kind kind, const rsa_public_key& signer,
                             const signature_scheme& scheme) {
  const statement_parts parts = split_statement(statement, signer.signature_size());
  check_kind(parts.text, kind);
  if (!signer.verifies(parts.text, parts.signature, scheme)) {
    throw statement_refused(statement_check::signature, "the signature is not one of the signer's key over the text");
  }
  const std::string_view text = as_text(parts.text);
  return kind == statement_kind::sign ? text.substr(0, text.size() - 1) : text;
}

rsa_public_key key_of_member(const std::string& pem) {
  try {
    return rsa_public_key::from_statement(pem);
  } catch (const format_error& fault) {
    throw statement_refused(statement_check::pub_key,
                            std::string("the statement tells a key that can't be accepted: ") + fault.what());
  }
}

/// How many values lie between the last counter and this one.
std::optional<std::uint64_t> gap_since(std::optional<std::uint64_t> last, std::uint64_t counter) {
  if (!last) {
    return std::nullopt;
  }
  if (counter <= *last) {
    throw statement_refused(statement_check::counter, "the counter is " + std::to_string(counter) +
                                                          " and must be above " + std::to_string(*last) +
                                                          ", the last one seen of this device");
  }
  return counter - *last - 1;
}

std::optional<std::uint32_t> user_of(std::optional<std::uint64_t> uid) {
  return uid && *uid != no_uid ? std::optional(static_cast<std::uint32_t>(*uid)) : std::nullopt;
}

/// The members of an export statement.
struct export_members {
  std::optional<std::uint64_t> counter;
  std::optional<std::uint32_t> uid;
  std::string pub_key;
};

export_members read_export(std::string_view text) {
  member_reader in(read_statement_text(text));
  export_members told;
  told.counter = in.optional_number("counter", std::numeric_limits<std::uint64_t>::max());
  told.uid = user_of(in.optional_number("uid", UINT32_MAX));
  told.pub_key = in.text("pub_key");
  in.expect_end();
  return told;
}

std::string describe_user(std::optional<std::uint32_t> uid) {
  return uid ? "the uid " + std::to_string(*uid) : "no uid";
}

void check_user(std::optional<std::uint32_t> told, std::optional<std::uint32_t> expected) {
  if (told != expected) {
    throw statement_refused(statement_check::uid, "the statement tells " + describe_user(told) + ", and " +
                                                      describe_user(expected) + " was expected");
  }
}

/// No finger has these ids: the TA tells the first when no finger touched since it started, and fails to tell the
/// other.
bool is_a_finger(std::uint32_t fid) {
  return fid != 0 && fid != UINT32_MAX;
}

void check_finger(std::optional<std::uint32_t> fid, const std::vector<std::uint32_t>& expected) {
  if (!fid) {
    throw statement_refused(statement_check::fid, "no finger touched for the statement");
  }
  const bool fits = is_a_finger(*fid) && (expected.empty() || std::ranges::find(expected, *fid) != expected.end());
  if (!fits) {
    throw statement_refused(statement_check::fid, "the finger " + std::to_string(*fid) + " is none that was expected");
  }
}

struct device_row {
  statement_check check;
  std::string sign_facts::*told;
  std::string factory_record::*recorded;
};
constexpr std::array device_rows =
    std::to_array<device_row>({{statement_check::tee_n, &sign_facts::tee_n, &factory_record::tee_n},
                               {statement_check::tee_v, &sign_facts::tee_v, &factory_record::tee_v},
                               {statement_check::fp_n, &sign_facts::fp_n, &factory_record::fp_n},
                               {statement_check::fp_v, &sign_facts::fp_v, &factory_record::fp_v},
                               {statement_check::cpu_id, &sign_facts::cpu_id, &factory_record::cpu_id}});

void check_device(const sign_facts& facts, const factory_record& device) {
  for (const device_row& row : device_rows) {
    if (facts.*row.told != device.*row.recorded) {
      throw statement_refused(row.check, std::string(check_name(row.check)) +
                                             " of the statement is not that of the device's factory record");
    }
  }
}

}  // namespace

std::string_view check_name(statement_check check) {
  return check_names.at(static_cast<std::size_t>(check));
}

statement_parts split_statement(byte_view statement, std::size_t signature_size) {
  const statement_parts parts = split_anywhere(statement);
  if (parts.signature.size() != signature_size) {
    refuse_layout(statement, std::to_string(parts.signature.size()) + " bytes follow a text of " +
                                 std::to_string(parts.text.size()) + ", and a signature has " +
                                 std::to_string(signature_size));
  }
  return parts;
}

std::optional<statement_kind> kind_of(byte_view text) {
  const std::string_view characters = as_text(text);
  const std::size_t nul = characters.find('\0');
  const bool for_signing = characters.starts_with(sign_beginning);
  if (for_signing && nul == characters.size() - 1) {
    return statement_kind::sign;
  }
  if (!for_signing && nul == std::string_view::npos && characters.ends_with('}')) {
    return statement_kind::export_key;
  }
  return std::nullopt;
}

export_facts verify_export_statement(byte_view statement, const export_expectations& expected) {
  const export_members told =
      read_export(signed_text(statement, statement_kind::export_key, expected.signer, signature_scheme{}));
  export_facts facts{.key = key_of_member(told.pub_key), .uid = told.uid, .counter = told.counter, .counter_gap = {}};
  if (told.counter) {
    facts.counter_gap = gap_since(expected.last_counter, *told.counter);
  }
  check_user(told.uid, expected.uid);
  return facts;
}

rsa_public_key told_key(byte_view statement) {
  const byte_view text = split_anywhere(statement).text;
  check_kind(text, statement_kind::export_key);
  return key_of_member(read_export(as_text(text)).pub_key);
}

sign_facts verify_sign_statement(byte_view statement, const sign_expectations& expected) {
  member_reader in(read_statement_text(signed_text(statement, statement_kind::sign, expected.signer, expected.scheme)));
  sign_facts facts;
  facts.raw = in.text("raw");
  if (const auto fid = in.optional_number("fid", UINT32_MAX)) {
    facts.fid = static_cast<std::uint32_t>(*fid);
  }
  facts.counter = in.number("counter");
  facts.uid = user_of(in.number("uid", UINT32_MAX));
  for (const device_row& row : device_rows) {
    facts.*row.told = in.text(check_name(row.check));
  }
  in.expect_end();

  facts.counter_gap = gap_since(expected.last_counter, facts.counter);
  if (facts.raw != expected.challenge) {
    throw statement_refused(statement_check::raw, "the message that was signed is not the challenge");
  }
  if (expected.fingers) {
    check_finger(facts.fid, *expected.fingers);
  }
  check_user(facts.uid, expected.uid);
  if (expected.device != nullptr) {
    check_device(facts, *expected.device);
  }
  return facts;
}

}  // namespace keymaster::client
