// Statements from any bytes, and from any text under a right signature: the relying party ends with facts or with a
// refusal, and the text that it accepts is the one that the TA writes for its members.
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <set>
#include <string>

#include "client/lib/statement.h"
#include "client/lib/statement_text.h"
#include "fuzz/fuzz_device.h"
#include "soter/json_writer.h"

namespace fuzzing {
namespace {

using namespace keymaster::client;

/// The signer of all statements, made anew for each process: a corpus holds no signatures.
EVP_PKEY* signing_key() {
  static EVP_PKEY* const key = EVP_RSA_gen(2048);
  return key;
}

const rsa_public_key& public_key() {
  static const rsa_public_key key = [] {
    unsigned char* der = nullptr;
    const int size = i2d_PUBKEY(signing_key(), &der);
    std::string base64(static_cast<std::size_t>(size + 2) / 3 * 4 + 1, '\0');
    EVP_EncodeBlock(reinterpret_cast<unsigned char*>(base64.data()), der, size);
    base64.pop_back();
    OPENSSL_free(der);
    return rsa_public_key::from_statement("-----BEGIN PUBLIC KEY-----\n" + base64 + "\n-----END PUBLIC KEY-----");
  }();
  return key;
}

bytes signed_statement(const std::string& text) {
  EVP_MD_CTX* const context = EVP_MD_CTX_new();
  bytes signature(public_key().signature_size());
  std::size_t length = signature.size();
  require(EVP_DigestSignInit(context, nullptr, EVP_sha256(), nullptr, signing_key()) == 1 &&
              EVP_DigestSign(context, signature.data(), &length, reinterpret_cast<const unsigned char*>(text.data()),
                             text.size()) == 1,
          "the key signs");
  EVP_MD_CTX_free(context);
  bytes statement;
  for (unsigned i = 0; i < 4; ++i) statement.push_back(static_cast<std::uint8_t>(text.size() >> (8 * i)));
  statement.insert(statement.end(), text.begin(), text.end());
  statement.insert(statement.end(), signature.begin(), signature.end());
  return statement;
}

/// The TA's text for the members. None: it has numbers that it can't tell, names twice, or too many members.
std::string text_of_ta(const std::vector<statement_member>& members) {
  using namespace keymaster;
  constexpr std::uint64_t largest_number = 99'999'999'999;
  const json_root root{json_value_init_object()};
  json_object* const object = json_value_get_object(root.get());
  std::set<std::string> names;
  for (const statement_member& member : members) {
    if (!names.insert(member.name).second) return {};
    if (const auto* const number = std::get_if<std::uint64_t>(&member.value)) {
      if (*number > largest_number) return {};
      if (json_object_set_number(object, member.name.c_str(), static_cast<double>(*number)) != 0) return {};
    } else if (json_object_set_string(object, member.name.c_str(), std::get<std::string>(member.value).c_str()) != 0) {
      return {};
    }
  }
  const json_text text{json_serialize_to_string(root.get())};
  return text ? text.get() : std::string();
}

void check_text(const std::string& text) {
  if (text.find('\0') != std::string::npos) return;  // statements are searched for those first
  std::vector<statement_member> members;
  try {
    members = read_statement_text(text);
  } catch (const statement_refused& refused) {
    require(!check_name(refused.check()).empty(), "a refusal names its check");
    return;
  }
  require(write_statement_text(members) == text, "what is read is written as it was");
  const std::string of_ta = text_of_ta(members);
  require(of_ta.empty() || of_ta == text, "the TA writes the same text");
}

/// Gives whether the statement was accepted.
bool accepts(byte_view statement, statement_kind kind) {
  try {
    if (kind == statement_kind::sign) {
      const sign_facts facts =
          verify_sign_statement(statement, {.signer = public_key(), .challenge = "c", .last_counter = 3});
      require(facts.raw == "c" && facts.counter > 3 && !facts.uid, "what is accepted was expected");
    } else {
      const export_facts facts = verify_export_statement(statement, {.signer = public_key(), .last_counter = 3});
      require(facts.counter.value_or(4) > 3 && !facts.uid, "what is accepted was expected");
      require(told_key(statement) == facts.key, "the key is told alike to everybody");
    }
  } catch (const statement_refused&) {
    return false;
  }
  return true;
}

void check_signed(std::string text, statement_kind kind) {
  if (kind == statement_kind::sign) text += '\0';
  const bytes statement = signed_statement(text);
  if (!accepts(statement, kind)) return;
  for (std::size_t i = 0; i < statement.size(); i += 97) {
    bytes changed = statement;
    changed[i] ^= 0x10;
    require(!accepts(changed, kind), "no other bytes are accepted");
  }
}

void check_raw(const bytes& statement) {
  require(!accepts(statement, statement_kind::sign) && !accepts(statement, statement_kind::export_key),
          "nothing is accepted that the key did not sign");
  try {
    (void)told_key(statement);
  } catch (const statement_refused&) {
  }
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance&) {
    input_reader in({data, size});
    const std::size_t way = in.below(4);
    const bytes rest = in.take(size);
    const std::string text(rest.begin(), rest.end());
    if (way == 0) check_raw(rest);
    if (way == 1) check_text(text);
    if (way == 2) check_signed(text, statement_kind::export_key);
    if (way == 3) check_signed(text, statement_kind::sign);
  });
  return 0;
}
