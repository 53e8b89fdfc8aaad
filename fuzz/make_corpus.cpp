// Writes the seeds that the fuzzers start from: whole lives of keys and operations, parameter sets, signatures, keys.
//
// usage: make_corpus FOLDER      writes FOLDER/command_fuzzer/* and so on for each fuzzer
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <utility>

#include "fuzz/frame_kinds.h"
#include "fuzz/fuzz_steps.h"
#include "fuzz/request_maker.h"
#include "fuzz/slot_seeds.h"
#include "fuzz/soter_steps.h"
#include "src/params/keymaster_defs.h"
#include "tee/remote/messages.h"

using namespace keymaster;

namespace fuzzing {
namespace {

using seeds = std::vector<std::pair<std::string, bytes>>;

void join(bytes& all, std::initializer_list<int> more) {
  for (const int byte : more) all.push_back(static_cast<std::uint8_t>(byte));
}

int number(step which) {
  return static_cast<int>(which);
}

// The bytes behind a step are its choices, in the order in which command_fuzzer.cpp asks for them.
void begin(bytes& all, int blob, int verify, int digest, int padding) {
  join(all, {number(step::begin), 0, verify, blob, with_scheme, digest, padding, 0, 0});
}
/// With an auth token: of a user, for a kind of authenticator, of the time that `stamp` chooses, unspoiled.
void begin_with_token(bytes& all, int blob, int user, int kind, int stamp) {
  join(all, {number(step::begin), 0, 0, blob, with_scheme | with_token, 4, 2, 0, user, kind, stamp, 1, 0, 0});
}
void update_with_token(bytes& all, int user, int kind, int stamp) {
  join(all, {number(step::update), 0, 1, 1, 0x55, 1, with_token, 1, user, kind, stamp, 1, 0, 0});
}
void update(bytes& all, int size) {
  join(all, {number(step::update), 0, 1, size});
  for (int i = 0; i < size; ++i) join(all, {i});
  join(all, {0, 0, 0});
}
void finish(bytes& all, int size) {
  join(all, {number(step::finish), 0, 1, size});
  for (int i = 0; i < size; ++i) join(all, {i});
  join(all, {0, 0, 0});
}

/// With block mode, padding, MAC length and nonce, by their places in the tables.
void begin_cipher(bytes& all, int blob, int purpose, int mode, int padding, int mac_length, int nonce) {
  join(all, {number(step::begin), 0, purpose, blob, with_cipher, mode, padding, mac_length, nonce, 0, 0});
}

/// One operation of each kind of key beside RSA signatures. The purposes count from signing on.
bytes other_operations() {
  constexpr int sign = 0, verify = 1, encrypt = 2, decrypt = 3;
  constexpr int rsa = 6, aes = 7, ec = 8, hmac = 9;
  bytes all;
  for (const int purpose : {encrypt, decrypt}) {
    for (int padding = 0; padding < 5; ++padding) {
      begin(all, rsa, purpose, padding == 3 ? 4 : 0, padding);
      update(all, 12);
      finish(all, 0);
    }
    for (int mode = 0; mode < 4; ++mode) {
      for (int padding = 0; padding < 2; ++padding) {
        begin_cipher(all, aes, purpose, mode, padding, 0, mode == 3 ? 1 : 2);
        update(all, 40);
        update(all, 24);
        finish(all, 0);
      }
    }
  }
  for (const int purpose : {sign, verify}) {
    for (int digest = 0; digest < 7; ++digest) {
      begin(all, ec, purpose, digest, 0);
      update(all, 40);
      finish(all, purpose == verify ? 70 : 0);
    }
    begin_cipher(all, hmac, purpose, 0, 0, 1, 0);
    update(all, 40);
    finish(all, purpose == verify ? 16 : 0);
  }
  return all;
}

/// One operation of every scheme: two pieces of message, then its end.
bytes whole_operations(int verify) {
  bytes all;
  for (int padding = 0; padding < 3; ++padding) {
    for (int digest = 0; digest < 7; ++digest) {
      begin(all, 0, verify, digest, padding);
      update(all, 10);
      update(all, 3);
      finish(all, verify != 0 ? 64 : 0);
    }
  }
  return all;
}

seeds command_seeds() {
  seeds all = {{"sign", whole_operations(0)}, {"verify", whole_operations(1)}, {"others", other_operations()}};
  bytes keys;
  join(keys, {number(step::generate), 1, 0, 0, number(step::import_key), 0, 1, 0, 0, 0, 0});
  for (const step use : {step::characteristics_size, step::characteristics, step::export_key, step::delete_key}) {
    for (int blob = 0; blob < 6; ++blob) {
      join(keys, {number(use), blob});
      // The second key belongs to an application; the others are asked for without an id and data.
      if (blob == 1) {
        join(keys, {0, 0, 0});
      } else {
        join(keys, {1, 0, 1, 0, 0});
      }
      if (use == step::characteristics || use == step::export_key) join(keys, {0});
    }
  }
  all.emplace_back("keys", keys);
  bytes tokens;
  for (int blob = 3; blob < 5; ++blob) {
    for (int kind = 0; kind < 4; ++kind) {
      begin_with_token(tokens, blob, 0, kind, kind + 2);
      update_with_token(tokens, 0, kind, kind + 3);
      finish(tokens, 0);
      begin(tokens, blob, 0, 4, 2);
    }
  }
  all.emplace_back("tokens", tokens);
  bytes limits;
  for (int use = 0; use < 4; ++use) {
    begin(limits, 2, 0, 4, 2);
    begin(limits, 5, 0, 4, 2);
    join(limits, {number(step::begin), 0, 0, 1, with_scheme | with_application, 4, 2, 0, 0});
  }
  all.emplace_back("limits", limits);
  bytes services;
  for (int service = 0; service < 6; ++service) join(services, {number(step::service_command), service, 0, 0});
  all.emplace_back("services", services);
  bytes queries;
  for (int command = 0; command < 12; ++command) {
    join(queries, {number(step::capability_query), command, 1, 0, 2});
    if (command % 2 == 1) join(queries, {12});
  }
  all.emplace_back("queries", queries);
  for (int after = 0; after < 8; ++after) {
    bytes faults;
    join(faults, {number(step::order_fault), after * 6, after % 2, 0});
    begin(faults, 0, 0, 4, 2);
    update(faults, 10);
    finish(faults, 0);
    all.emplace_back("fault_" + std::to_string(after), faults);
  }
  return all;
}

seeds marshal_seeds() {
  seeds all;
  const auto add = [&](const std::string& name, const bytes& set) {
    bytes input = {0xFF, 0x01};  // the capacity of the slot
    input.insert(input.end(), set.begin(), set.end());
    all.emplace_back(name, input);
  };
  add("empty", param_writer{}.marshal());
  add("numbers", param_writer{}
                     .add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
                     .add(KM_TAG_KEY_SIZE, 2048)
                     .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
                     .add(KM_TAG_NO_AUTH_REQUIRED, 1)
                     .marshal());
  add("blobs", param_writer{}
                   .add_blob(KM_TAG_APPLICATION_ID, {1, 2, 3})
                   .add_blob(KM_TAG_NONCE, bytes(16, 7))
                   .add_blob(KM_TAG_ROOT_OF_TRUST, {})
                   .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
                   .marshal());
  return all;
}

/// A field's place in the table of sizes, then a signature.
seeds signature_seeds() {
  bytes small = {2, 0x30, 6, 2, 1, 1, 2, 1, 1};
  bytes full = {2, 0x30, 0x46};
  for (int i = 0; i < 2; ++i) {
    join(full, {2, 0x21, 0});
    full.insert(full.end(), 32, 0x91);
  }
  bytes wide = {4, 0x30, 0x81, 0x88};
  for (int i = 0; i < 2; ++i) {
    join(wide, {2, 0x42, 1});
    wide.insert(wide.end(), 65, 0x91);
  }
  return {{"small", small}, {"full", full}, {"wide", wide}, {"zero", {2, 0x30, 4, 2, 0, 2, 0}}};
}

/// The module's place, a digest, a capacity, then key data.
seeds key_data_seeds() {
  seeds all;
  const auto add = [&](const std::string& name, int module, std::uint32_t algorithm) {
    bytes seed = {static_cast<std::uint8_t>(module), 4, 200};
    const bytes zeros(16);
    input_reader unchanged(zeros);
    const bytes material = read_material(unchanged, algorithm);
    if (algorithm == KM_ALGORITHM_RSA) append_u32(seed, 512);
    if (algorithm == KM_ALGORITHM_AES) append_u32(seed, 128);
    if (algorithm == KM_ALGORITHM_HMAC) join(seed, {128, 0, 0, 0, 4, 0, 0, 0xA0});
    seed.insert(seed.end(), material.begin(), material.end());
    all.emplace_back(name, seed);
    all.emplace_back(name + "_material", bytes{static_cast<std::uint8_t>(module), 4, 200});
    all.back().second.insert(all.back().second.end(), material.begin(), material.end());
  };
  add("rsa", 0, KM_ALGORITHM_RSA);
  add("ec", 1, KM_ALGORITHM_EC);
  add("aes", 2, KM_ALGORITHM_AES);
  add("hmac", 3, KM_ALGORITHM_HMAC);
  return all;
}

int number(soter_step which) {
  return static_cast<int>(which);
}
int number(soter_key which) {
  return static_cast<int>(which);
}

// The bytes behind a step are its choices, in the order in which soter_fuzzer.cpp asks for them.
void export_statement(bytes& all, soter_key key) {
  join(all, {number(soter_step::export_key), number(key), 0});
}
void touch(bytes& all, int client, int age) {
  join(all, {number(soter_step::notify), client, 0, 7, 0, 0, 0, age, 0});
}
void begin_statement(bytes& all, soter_key key, int padding, int digest) {
  join(all, {number(soter_step::begin), number(key), padding, digest});
}
void add_message(bytes& all, const std::string& text) {
  join(all, {number(soter_step::update), 0, static_cast<int>(text.size())});
  all.insert(all.end(), text.begin(), text.end());
}
void finish_statement(bytes& all) {
  join(all, {number(soter_step::finish)});
}

/// With a service: its place, and where it responds the room for it.
void load(bytes& all) {
  join(all, {number(soter_step::service), 0});
}

seeds soter_seeds() {
  bytes services, exports, signatures, growth, fingers, answers, counters;
  load(services);
  join(services, {number(soter_step::service), 1, number(soter_step::service), 2, 0xBD, 1, number(soter_step::service),
                  3, 64, 0, number(soter_step::restart), number(soter_step::service), 3, 8, 0});
  for (std::size_t key = 0; key < soter_key_count; ++key) export_statement(exports, static_cast<soter_key>(key));
  join(exports, {number(soter_step::restart)});
  export_statement(exports, soter_key::counted_by_attk);
  for (int padding = 0; padding < 3; ++padding) {
    begin_statement(signatures, soter_key::counted_by_attk, padding, 0);
    add_message(signatures, "challenge \"1\"/");
    add_message(signatures, "\xC3\xA9");
    finish_statement(signatures);
  }
  begin_statement(growth, soter_key::by_attk, 0, 0);
  for (int size = 0; size < 6; ++size) join(growth, {number(soter_step::update), 7, size});
  finish_statement(growth);
  touch(fingers, 0, 0);
  load(fingers);
  for (const int client : {0, 6, 7}) {
    for (int age = 0; age < 6; ++age) touch(fingers, client, age);
    begin_statement(fingers, soter_key::counted_by_key, 0, 0);
    add_message(fingers, "x");
    finish_statement(fingers);
  }
  join(fingers, {number(soter_step::advance_clock), 0xB9, 0x0B});
  begin_statement(fingers, soter_key::counted_by_key, 0, 0);
  finish_statement(fingers);
  for (int answer = 0; answer < 8; ++answer) {
    join(answers, {number(soter_step::change_key), answer, 0, answer, 1, 2, 3, number(soter_step::service), 1});
    join(answers, {number(soter_step::change_property), 0, answer, 1, 2, 3, number(soter_step::service), 0});
  }
  for (int value = 0; value < 6; ++value) {
    join(counters, {number(soter_step::store_counter), value, value % 5});
    for (int use = 0; use < 3; ++use) export_statement(counters, soter_key::counted_by_key);
  }
  seeds all = {{"services", services}, {"exports", exports}, {"signatures", signatures}, {"growth", growth},
               {"fingers", fingers},   {"answers", answers}, {"counters", counters}};
  for (int after = 0; after < 12; ++after) {
    bytes faults;
    join(faults, {number(soter_step::order_fault), after * 8, after % 2, 0});
    begin_statement(faults, soter_key::counted_by_attk, 0, 0);
    join(faults, {number(soter_step::order_fault), after * 3, after % 2, 0});
    add_message(faults, "x");
    finish_statement(faults);
    export_statement(faults, soter_key::counted_by_attk);
    all.emplace_back("fault_" + std::to_string(after), faults);
  }
  return all;
}

/// No fault, the choices, then a box.
seeds tlv_seeds() {
  const bytes head = {0, 1, 2, 3, 4, 5, 6, 7, 8};
  bytes inner = {7, 0, 4, 0, 77, 0, 0, 0}, box = head;
  join(box, {0x35, 0x18, 7, 0, 's', 'e', 'n', 's', 'o', 'r', 0, 1, 0, 8, 0});
  box.insert(box.end(), inner.begin(), inner.end());
  join(box, {2, 0, 0, 0, 2, 0, 1, 0, 9});
  bytes starved = box;
  starved.front() = 37;
  return {{"empty", head}, {"box", box}, {"starved", starved}};
}

/// A capacity, a count of members, then each: its name, its kind, no fault, its value.
seeds json_seeds() {
  bytes object = {200, 0, 5};
  join(object, {1, 'a', 0, 0, 8, 'x', '/', 'y', '"', '\\', '\n', 0x01, 'z'});
  join(object, {1, 'b', 4, 0, 0, 7, 0, 0, 0, 2, 'c', 'd', 4, 0, 2, 64, 0, 0, 0});
  join(object, {1, 'e', 7, 0, 1, 1, 'f', 0, 0, 3, 0xE2, 0x82, 0xAC, 1, 'a', 4, 0, 1, 0, 0, 0, 0, 0, 0});
  return {{"object", object}};
}

seeds utf8_seeds() {
  seeds all;
  for (const char* const text : {"plain", "\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80", "\xED\x9F\xBF\xEE\x80\x80",
                                 "\xED\xA0\x80", "\xF4\x8F\xBF\xBF", "\xF4\x90\x80\x80", "\xC0\xAF"}) {
    const std::string content = text;
    all.emplace_back("text_" + std::to_string(all.size()), bytes(content.begin(), content.end()));
  }
  return all;
}

/// The public half of a key that is made for this, as a statement has it.
std::string told_key() {
  EVP_PKEY* const key = EVP_RSA_gen(2048);
  unsigned char* der = nullptr;
  const int size = i2d_PUBKEY(key, &der);
  std::string base64(static_cast<std::size_t>(size + 2) / 3 * 4 + 1, '\0');
  EVP_EncodeBlock(reinterpret_cast<unsigned char*>(base64.data()), der, size);
  base64.pop_back();
  OPENSSL_free(der);
  EVP_PKEY_free(key);
  std::string escaped;
  for (const char character : base64) {
    if (character == '/') escaped += '\\';
    escaped += character;
  }
  return "-----BEGIN PUBLIC KEY-----\\n" + escaped + "\\n-----END PUBLIC KEY-----";
}

/// The way that the text goes, then the text: as it is, as one that a key states, as one that it signed.
seeds statement_seeds() {
  const std::string of_key = "{\"counter\":7,\"pub_key\":\"" + told_key() + "\"}";
  const std::string of_message =
      R"({"raw":"c","fid":5,"counter":9,"uid":4294967295,"tee_n":"a","tee_v":"b","fp_n":"c","fp_v":"d","cpu_id":"e\/f"})";
  seeds all;
  const auto add = [&](const std::string& name, std::uint8_t way, const std::string& text) {
    bytes seed = {way};
    seed.insert(seed.end(), text.begin(), text.end());
    all.emplace_back(name, seed);
  };
  add("bare", 0, std::string("\x02\0\0\0{}", 6) + std::string(256, 'x'));
  add("text", 1, of_message);
  add("key", 2, of_key);
  add("message", 3, of_message);
  return all;
}

/// The kind of body, a choice of what the TA does, and the body.
template <class Message>
bytes frame_seed(frame_kinds kind, const Message& message) {
  bytes seed(2 + hosted_tee::remote::frame_limit);
  seed[0] = static_cast<std::uint8_t>(kind);
  hosted_tee::remote::frame_writer out(std::span(seed).subspan(2));
  write_body(out, message);
  seed.resize(2 + out.size());
  return seed;
}

seeds frame_seeds() {
  namespace remote = hosted_tee::remote;
  const bytes data = {1, 2, 3};
  remote::request_slots request{0x7653, {}};
  request.slots[1] = {0, 0, remote::memory_source::carried, 3, 0, 0, data};
  request.slots[2] = {0, 0, remote::memory_source::carried, 16, 0, 0, {}};
  request.slots[3] = {0, 0, remote::memory_source::shared, 64, 1, 128, {}};
  remote::answer_slots answer{0x7653, {}};
  answer.slots[2] = {0, 0, 3, data};
  remote::status_answer status;
  status.version = "1.0";
  status.instances.resize(1);
  remote::log_answer log;
  log.lines = {{7, 1, 20, "TA", "function", "text"}};
  return {{"invoke_request", frame_seed(frame_kinds::invoke_request, remote::invoke_request{1, 2, request})},
          {"invoke_answer", frame_seed(frame_kinds::invoke_answer, remote::invoke_answer{{}, answer})},
          {"open_request", frame_seed(frame_kinds::open_request, remote::open_request{{}, 1, 2, request})},
          {"open_answer", frame_seed(frame_kinds::open_answer, remote::open_answer{{}, 1, answer})},
          {"hello_answer", frame_seed(frame_kinds::hello_answer, remote::hello_answer{})},
          {"share_request", frame_seed(frame_kinds::share_request, remote::share_request{4096, 3})},
          {"status_answer", frame_seed(frame_kinds::status_answer, status)},
          {"log_answer", frame_seed(frame_kinds::log_answer, log)}};
}

bool write(const std::filesystem::path& folder, const seeds& all) {
  std::filesystem::create_directories(folder);
  for (const auto& [name, content] : all) {
    std::ofstream file(folder / name, std::ios::binary);
    file.write(reinterpret_cast<const char*>(content.data()), static_cast<std::streamsize>(content.size()));
    if (!file) return false;
  }
  return true;
}

}  // namespace
}  // namespace fuzzing

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: make_corpus FOLDER\n");
    return 2;
  }
  const std::filesystem::path folder = argv[1];
  const std::pair<const char*, fuzzing::seeds> corpora[] = {
      {"command_fuzzer", fuzzing::command_seeds()},     {"marshal_fuzzer", fuzzing::marshal_seeds()},
      {"signature_fuzzer", fuzzing::signature_seeds()}, {"key_data_fuzzer", fuzzing::key_data_seeds()},
      {"soter_fuzzer", fuzzing::soter_seeds()},         {"tlv_fuzzer", fuzzing::tlv_seeds()},
      {"json_fuzzer", fuzzing::json_seeds()},           {"utf8_fuzzer", fuzzing::utf8_seeds()},
      {"statement_fuzzer", fuzzing::statement_seeds()}, {"frame_fuzzer", fuzzing::frame_seeds()},
      {"slot_fuzzer", fuzzing::slot_seeds()},
  };
  bool written = true;
  for (const auto& [name, seeds] : corpora) written = fuzzing::write(folder / name, seeds) && written;
  return written ? 0 : 1;
}
