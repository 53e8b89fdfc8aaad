#include "tests/second_platform/scenario.h"

using namespace keymaster;
using namespace testing_support;

namespace second_platform {
namespace {

using preparation = std::function<bytes(ta&)>;

preparation generated(const param_list& params) {
  return [params](ta& t) { return t.must_generate(params); };
}

bytes nothing(ta&) {
  return {};
}

scenario key_command(const std::string& name, preparation prepare,
                     std::function<command_answer(ta&, const bytes&)> command) {
  return {name, std::move(prepare), [](ta&, const bytes&) { return 0U; },
          [command = std::move(command)](ta& t, const bytes& blob, std::uint32_t) { return command(t, blob); }};
}

/// What an operation is fed before the step in question, and with it.
struct operation_plan {
  std::string name;
  param_list key;
  std::uint32_t purpose;
  param_list params;
  bytes message;
  bytes last;  // finish's input: the signature that is verified
};

/// What the bare public operation yields for the signature of a message with PKCS #1 v1.5 padding and no digest: the
/// block (RFC 8017, section 9.2) without its first, zero byte.
bytes recovered_block(const bytes& message) {
  return join({{0x01}, bytes(125 - message.size(), 0xFF), {0x00}, message});
}

std::uint32_t begun(ta& t, const bytes& blob, const operation_plan& plan) {
  if (plan.name == "rsa verify raw") platform.public_operation = recovered_block(plan.message);
  return t.must_begin(plan.purpose, blob, plan.params);
}

std::uint32_t fed(ta& t, const bytes& blob, const operation_plan& plan) {
  const std::uint32_t handle = begun(t, blob, plan);
  if (t.update(handle, plan.message) != outcome{}) ADD_FAILURE() << plan.name << ": the update failed";
  return handle;
}

void add_steps(std::vector<scenario>& all, const operation_plan& plan) {
  all.push_back(key_command("begin " + plan.name, generated(plan.key), [plan](ta& t, const bytes& blob) {
    const command_answer answer = t.begin(plan.purpose, blob, plan.params);
    if (answer == outcome{}) (void)t.abort(answer.b);
    return answer;
  }));
  all.push_back({"update " + plan.name, generated(plan.key),
                 [plan](ta& t, const bytes& blob) { return begun(t, blob, plan); },
                 [plan](ta& t, const bytes&, std::uint32_t handle) { return t.update(handle, plan.message); }});
  all.push_back({"finish " + plan.name, generated(plan.key),
                 [plan](ta& t, const bytes& blob) { return fed(t, blob, plan); },
                 [plan](ta& t, const bytes&, std::uint32_t handle) { return t.finish(handle, plan.last); }});
}

/// r and s as they come from the platform, in DER (SEC 1, appendix C.5): two positive numbers of 32 bytes each.
bytes der_of_fixed_signature() {
  const bytes raw = fixed_output(64);
  const auto number = [](bytes value) {
    if ((value[0] & 0x80) != 0) value.insert(value.begin(), 0);
    return join({{0x02, static_cast<std::uint8_t>(value.size())}, value});
  };
  const bytes numbers = join({number({raw.begin(), raw.begin() + 32}), number({raw.begin() + 32, raw.end()})});
  return join({{0x30, static_cast<std::uint8_t>(numbers.size())}, numbers});
}

std::vector<operation_plan> plans() {
  const bytes text = pattern(48, 9);
  const bytes padded = bytes(48, 16);  // whose last block is nothing but padding
  const param_list pkcs1 = digest_params(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const param_list pss = digest_params(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS);
  const param_list raw = digest_params(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const param_list oaep = digest_params(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP);
  const param_list bare = digest_params(KM_DIGEST_NONE, KM_PAD_NONE);
  const param_list ecdsa = param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  const bytes tag = fixed_output(16);
  return {
      {"aes ecb encrypt", aes_key(), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_ECB, KM_PAD_PKCS7), text, {}},
      {"aes cbc encrypt", aes_key(), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_CBC), text, {}},
      {"aes ctr encrypt", aes_key(), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_CTR), text, {}},
      {"aes gcm encrypt", aes_key(), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_GCM), text, {}},
      {"aes cbc decrypt", aes_key(), KM_PURPOSE_DECRYPT, aes_params(KM_MODE_CBC, KM_PAD_PKCS7), padded, {}},
      {"aes ctr decrypt", aes_key(), KM_PURPOSE_DECRYPT, aes_params(KM_MODE_CTR), text, {}},
      {"aes gcm decrypt", aes_key(), KM_PURPOSE_DECRYPT, aes_params(KM_MODE_GCM), join({text, tag}), {}},
      {"rsa sign pkcs1", rsa_key(), KM_PURPOSE_SIGN, pkcs1, text, {}},
      {"rsa sign pss", rsa_key(), KM_PURPOSE_SIGN, pss, text, {}},
      {"rsa sign raw", rsa_key(), KM_PURPOSE_SIGN, raw, text, {}},
      {"rsa verify pkcs1", rsa_key(), KM_PURPOSE_VERIFY, pkcs1, text, fixed_output(128)},
      {"rsa verify raw", rsa_key(), KM_PURPOSE_VERIFY, raw, text, fixed_output(128)},
      {"rsa encrypt oaep", rsa_key(), KM_PURPOSE_ENCRYPT, oaep, text, {}},
      {"rsa decrypt oaep", rsa_key(), KM_PURPOSE_DECRYPT, oaep, pattern(128), {}},
      {"rsa decrypt bare", rsa_key(), KM_PURPOSE_DECRYPT, bare, pattern(128), {}},
      {"ec sign", ec_key(), KM_PURPOSE_SIGN, ecdsa, text, {}},
      {"ec verify", ec_key(), KM_PURPOSE_VERIFY, ecdsa, text, der_of_fixed_signature()},
      {"hmac sign", hmac_key(), KM_PURPOSE_SIGN, mac_params(), text, {}},
      {"hmac verify", hmac_key(), KM_PURPOSE_VERIFY, mac_params(), text, fixed_output(32)},
      {"soter sign", soter_key(), KM_PURPOSE_SIGN, pkcs1, text, {}},
  };
}

/// Text for the statement, and not just bytes.
operation_plan with_text(operation_plan plan) {
  if (plan.name == "soter sign") plan.message = from_text("a message that is text");
  return plan;
}

bytes ec_material() {
  return join({u32(256), prefixed(pattern(32, 1)), prefixed(pattern(32, 2)), prefixed(pattern(32, 3))});
}

bytes rsa_material() {
  bytes material = join({prefixed(pattern(128, 1)), prefixed(bytes{1, 0, 1}), prefixed(pattern(128, 2))});
  for (std::uint32_t seed = 3; seed < 8; ++seed) material = join({material, prefixed(pattern(64, seed))});
  return material;
}

/// A key that asks for a token with every step. The MAC of the token is what this platform calls one.
constexpr std::uint64_t secure_id = 0x1122334455667788;
constexpr std::uint32_t password = 1;

bytes token_for(std::uint32_t handle) {
  const bytes type_and_time = {0, 0, 0, password, 0, 0, 0, 0, 0, 0, 0, 1};  // big-endian
  return join({{0}, u64(handle), u64(secure_id), u64(0), type_and_time, fixed_output(32)});
}

scenario token_scenario() {
  param_list key = hmac_key();
  key.remove(KM_TAG_NO_AUTH_REQUIRED).add(KM_TAG_USER_SECURE_ID, secure_id).add(KM_TAG_USER_AUTH_TYPE, password);
  return {"update with token", generated(key),
          [](ta& t, const bytes& blob) { return t.must_begin(KM_PURPOSE_SIGN, blob, mac_params()); },
          [](ta& t, const bytes&, std::uint32_t handle) {
            return t.update(handle, pattern(48), param_list{}.add_blob(KM_TAG_AUTH_TOKEN, token_for(handle)));
          }};
}

std::vector<scenario> all_scenarios() {
  std::vector<scenario> all;
  const std::pair<std::string, param_list> kinds[] = {
      {"rsa", rsa_key()}, {"aes", aes_key()}, {"ec", ec_key()}, {"ec 521", ec_key(521)}, {"hmac", hmac_key()}};
  for (const auto& [name, params] : kinds) {
    all.push_back(key_command("generate " + name, nothing,
                              [params = params](ta& t, const bytes&) { return t.generate(params); }));
  }
  const std::tuple<std::string, param_list, bytes> imports[] = {{"rsa", rsa_key(), rsa_material()},
                                                                {"aes", aes_key(), pattern(16)},
                                                                {"ec", ec_key(), ec_material()},
                                                                {"hmac", hmac_key(), pattern(32)}};
  for (const auto& [name, params, material] : imports) {
    all.push_back(key_command("import " + name, nothing, [params = params, material = material](ta& t, const bytes&) {
      return t.import_key(params, material);
    }));
  }
  const auto describe = [](ta& t, const bytes& blob) { return t.characteristics(blob); };
  const auto export_key = [](ta& t, const bytes& blob) { return t.export_key(blob); };
  all.push_back(key_command("characteristics", generated(aes_key()), describe));
  all.push_back(key_command("export rsa", generated(rsa_key()), export_key));
  all.push_back(key_command("export ec", generated(ec_key()), export_key));
  all.push_back(key_command("export soter", generated(soter_key()), export_key));
  for (const operation_plan& plan : plans()) add_steps(all, with_text(plan));
  all.push_back(token_scenario());
  const std::pair<std::string, std::uint32_t> soter[] = {{"generate attk", KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR},
                                                         {"verify attk", KM_COMMAND_SOTER_VERIFY_ATTK_KEY_PAIR},
                                                         {"export attk", KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY},
                                                         {"device id", KM_COMMAND_SOTER_GET_DEVICE_ID}};
  for (const auto& [name, command] : soter) {
    all.push_back(
        key_command("soter " + name, nothing, [command = command](ta& t, const bytes&) { return t.soter(command); }));
  }
  return all;
}

}  // namespace

const std::vector<scenario>& scenarios() {
  static const std::vector<scenario> all = all_scenarios();
  return all;
}

}  // namespace second_platform
