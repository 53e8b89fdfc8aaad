// Writes the seeds that the fuzzers start from: whole lives of keys and operations, parameter sets, signatures, keys.
//
// usage: make_corpus FOLDER      writes FOLDER/command_fuzzer/* and so on for each fuzzer
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <utility>

#include "fuzz/fuzz_steps.h"
#include "fuzz/request_maker.h"
#include "src/params/keymaster_defs.h"

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
  const bool written = fuzzing::write(folder / "command_fuzzer", fuzzing::command_seeds()) &&
                       fuzzing::write(folder / "marshal_fuzzer", fuzzing::marshal_seeds()) &&
                       fuzzing::write(folder / "signature_fuzzer", fuzzing::signature_seeds()) &&
                       fuzzing::write(folder / "key_data_fuzzer", fuzzing::key_data_seeds());
  return written ? 0 : 1;
}
