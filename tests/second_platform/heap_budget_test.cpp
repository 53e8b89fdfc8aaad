// What of its 512 KiB heap the TA takes at most: by each command, by sixteen live operations of a kind, and by the
// largest input that it can still work on. Each figure has a ceiling that a change must not pass unnoticed; the tables
// are printed for the documents, which show those of the 32-bit build.
#include <fmt/format.h>

#include <algorithm>
#include <functional>

#include "ta/ta_limits.h"
#include "tests/second_platform/ta_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace second_platform {
namespace {

constexpr std::uint32_t wide_room = 16384;

/// A kind of operation, with a message that an update takes whole.
struct kind {
  std::string name;
  param_list key;
  std::uint32_t purpose;
  param_list params;
  std::size_t message;
  std::size_t last = 0;  // bytes of finish's input
  std::uint32_t ceiling = 0;
  std::uint32_t ceiling_of_sixteen = 0;
};

param_list pkcs1() {
  return digest_params(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
}

std::vector<kind> kinds() {
  const param_list oaep = digest_params(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP);
  const param_list ecdsa = param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  const auto key = [](param_list params, std::uint32_t bits) {
    return params.remove(KM_TAG_KEY_SIZE).add(KM_TAG_KEY_SIZE, bits);
  };
  return {
      {"AES-256 CBC encrypt, PKCS #7", key(aes_key(), 256), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_CBC, KM_PAD_PKCS7),
       4000, 0, 2048, 10240},
      {"AES-256 CBC decrypt, PKCS #7", key(aes_key(), 256), KM_PURPOSE_DECRYPT, aes_params(KM_MODE_CBC, KM_PAD_PKCS7),
       4000, 0, 2048, 10240},
      {"AES-256 GCM encrypt", key(aes_key(), 256), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_GCM), 4000, 0, 2048, 10240},
      {"AES-256 GCM decrypt", key(aes_key(), 256), KM_PURPOSE_DECRYPT, aes_params(KM_MODE_GCM), 4000, 0, 2048, 10240},
      {"RSA-2048 sign, PKCS #1", rsa_key(2048), KM_PURPOSE_SIGN, pkcs1(), 4000, 0, 6144, 14336},
      {"RSA-4096 sign, PKCS #1", rsa_key(4096), KM_PURPOSE_SIGN, pkcs1(), 4000, 0, 9216, 18432},
      {"RSA-8192 sign, PKCS #1", rsa_key(8192), KM_PURPOSE_SIGN, pkcs1(), 4000, 0, 16384, 26624},
      {"RSA-4096 verify, PKCS #1", rsa_key(4096), KM_PURPOSE_VERIFY, pkcs1(), 4000, 512, 9216, 18432},
      {"RSA-4096 encrypt, OAEP", rsa_key(4096), KM_PURPOSE_ENCRYPT, oaep, 400, 0, 9216, 18432},
      {"RSA-4096 decrypt, OAEP", rsa_key(4096), KM_PURPOSE_DECRYPT, oaep, 512, 0, 9216, 18432},
      {"EC-256 sign", ec_key(), KM_PURPOSE_SIGN, ecdsa, 4000, 0, 2048, 8192},
      {"EC-521 sign", ec_key(521), KM_PURPOSE_SIGN, ecdsa, 4000, 0, 2048, 8192},
      {"HMAC-SHA-256 sign", hmac_key(), KM_PURPOSE_SIGN, mac_params(), 4000, 0, 2048, 8192},
      {"RSA-2048 soter sign", soter_key(), KM_PURPOSE_SIGN, pkcs1(), 4000, 0, 16384, 81920},
  };
}

bytes message_of(const kind& what) {
  if (what.name.starts_with("AES-256 CBC decrypt")) return bytes(what.message, 16);
  return bytes(what.message, 'm');
}

class HeapBudgetTest : public SecondPlatformTest {
 protected:
  /// peak_of answers the most that the heap held during a command, what it held before included.
  std::uint32_t peak_of(const std::function<outcome()>& command) {
    platform.restart_peak();
    EXPECT_EQ(command(), outcome{});
    return platform.heap_peak();
  }

  bytes blob_of(const param_list& key) { return keymaster_ta.must_generate(key, wide_room); }

  void print_row(const std::string& name, std::uint32_t peak, std::uint32_t ceiling) {
    fmt::print("| {} | {} |\n", name, peak);
    EXPECT_LE(peak, ceiling) << name;
    EXPECT_GT(peak, platform.heap_bytes()) << name;
  }
};

/// answers is the part of an answer that success is judged by.
outcome answers(const command_answer& answer) {
  return answer;
}

TEST_F(HeapBudgetTest, AFreshInstanceHoldsItsTablesAlone) {
  fmt::print("\n| what | heap bytes |\n|---|---:|\n| a fresh instance | {} |\n", platform.heap_bytes());
  EXPECT_LE(platform.heap_bytes(), 18432U);
  EXPECT_EQ(keymaster_ta.soter(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), outcome{});
  fmt::print("| with the soter resources loaded | {} |\n", platform.heap_bytes());
  EXPECT_LE(platform.heap_bytes(), 20480U);
}

TEST_F(HeapBudgetTest, KeyCommands) {
  fmt::print("\n| key command | most heap bytes |\n|---|---:|\n");
  struct row {
    std::string name;
    param_list key;
    std::uint32_t generate, describe;
  };
  const row rows[] = {{"RSA-1024", rsa_key(1024), 24576, 24576}, {"RSA-2048", rsa_key(2048), 24576, 24576},
                      {"RSA-4096", rsa_key(4096), 28672, 28672}, {"RSA-8192", rsa_key(8192), 36864, 36864},
                      {"EC-256", ec_key(), 20480, 20480},        {"EC-521", ec_key(521), 20480, 20480},
                      {"AES-128", aes_key(), 20480, 20480},      {"HMAC-256", hmac_key(), 20480, 20480}};
  for (const row& each : rows) {
    bytes blob;
    print_row("generate " + each.name, peak_of([&] {
                const command_answer made = keymaster_ta.generate(each.key, wide_room);
                blob = made.body;
                return answers(made);
              }),
              each.generate);
    print_row("describe " + each.name, peak_of([&] { return answers(keymaster_ta.characteristics(blob)); }),
              each.describe);
  }
  const bytes rsa = blob_of(rsa_key(4096)), ec = blob_of(ec_key()), soter = blob_of(soter_key());
  print_row("export RSA-4096", peak_of([&] { return answers(keymaster_ta.export_key(rsa)); }), 28672);
  print_row("export EC-256", peak_of([&] { return answers(keymaster_ta.export_key(ec)); }), 20480);
  print_row("export soter RSA-2048", peak_of([&] { return answers(keymaster_ta.export_key(soter)); }), 40960);
  print_row("import AES-128",
            peak_of([&] { return answers(keymaster_ta.import_key(aes_key(), pattern(16), wide_room)); }), 22528);
}

TEST_F(HeapBudgetTest, OperationCommandsAndSixteenLiveOperations) {
  fmt::print(
      "\n| operation | most heap bytes: begin | update | finish | held by 16 live ones |\n|---|---:|---:|---:|---:|\n");
  EXPECT_EQ(keymaster_ta.soter(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), outcome{});
  const std::uint32_t idle = platform.heap_bytes();
  for (const kind& each : kinds()) {
    SCOPED_TRACE(each.name);
    const bytes blob = blob_of(each.key);
    const bytes message = message_of(each);
    std::uint32_t handle = 0;
    const std::uint32_t begin = peak_of([&] {
      const command_answer begun = keymaster_ta.begin(each.purpose, blob, each.params);
      handle = begun.b;
      return answers(begun);
    });
    const std::uint32_t update = peak_of([&] { return answers(keymaster_ta.update(handle, message)); });
    if (each.name == "AES-256 GCM decrypt") {
      EXPECT_EQ(keymaster_ta.update(handle, fixed_output(16)), outcome{});
    }
    const bytes last = each.last == 0 ? bytes{} : fixed_output(each.last);
    const std::uint32_t finish = peak_of([&] { return answers(keymaster_ta.finish(handle, last, {}, wide_room)); });
    EXPECT_EQ(platform.heap_bytes(), idle);

    std::vector<std::uint32_t> live;
    for (int i = 0; i < 16; ++i) live.push_back(keymaster_ta.must_begin(each.purpose, blob, each.params));
    const std::uint32_t held = platform.heap_bytes() - idle;
    for (const std::uint32_t open : live) EXPECT_EQ(keymaster_ta.abort(open), outcome{});

    fmt::print("| {} | {} | {} | {} | {} |\n", each.name, begin, update, finish, held);
    EXPECT_LE(std::max({begin, update, finish}) - idle, each.ceiling);
    EXPECT_LE(held, each.ceiling_of_sixteen);
    EXPECT_LT(idle + held + each.ceiling, ta_heap_size / 2) << "sixteen of them leave room for one command more";
  }
}

class LargestInputTest : public HeapBudgetTest {
 protected:
  static constexpr std::uint32_t search_end = 4 << 20;

  /// largest finds the most bytes for which `works`; it must fail for all that are more.
  std::uint32_t largest(const std::function<bool(std::uint32_t)>& works) {
    if (works(search_end)) return search_end;
    std::uint32_t good = 0, bad = search_end;
    while (bad - good > 1) {
      const std::uint32_t middle = good + (bad - good) / 2;
      (works(middle) ? good : bad) = middle;
      EXPECT_EQ(platform.heap_bytes(), idle_);
    }
    return good;
  }

  void print_largest(const std::string& name, std::uint32_t size, std::uint32_t floor) {
    fmt::print("| {} | {} |\n", name, size == search_end ? "as much as there is" : std::to_string(size));
    EXPECT_GE(size, floor) << name;
  }

  bool updates(const kind& what, const bytes& message, const param_list& params, std::uint32_t capacity) {
    const std::uint32_t handle = keymaster_ta.must_begin(what.purpose, blob_, what.params);
    const bool worked = keymaster_ta.update(handle, message, params, capacity) == outcome{};
    if (worked) (void)keymaster_ta.abort(handle);
    return worked;
  }

  bool states(std::uint32_t size, std::uint32_t piece) {
    const std::uint32_t handle = keymaster_ta.must_begin(KM_PURPOSE_SIGN, blob_, pkcs1());
    for (std::uint32_t sent = 0; sent < size; sent += piece) {
      const bytes part(std::min(piece, size - sent), 'm');
      if (keymaster_ta.update(handle, part) != outcome{}) return false;
    }
    return keymaster_ta.finish(handle, {}, {}, size * 2 + wide_room) == outcome{};
  }

  std::uint32_t idle_ = 0;
  bytes blob_;
};

TEST_F(LargestInputTest, OfEveryKind) {
  fmt::print("\n| largest input | bytes |\n|---|---:|\n");
  EXPECT_EQ(keymaster_ta.soter(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), outcome{});
  idle_ = platform.heap_bytes();
  const kind gcm = {"", aes_key(), KM_PURPOSE_ENCRYPT, aes_params(KM_MODE_GCM), 0};
  const kind mac = {"", hmac_key(), KM_PURPOSE_SIGN, mac_params(), 0};
  blob_ = blob_of(gcm.key);
  print_largest("AES input of one update",
                largest([&](std::uint32_t size) { return updates(gcm, bytes(size), {}, size + 16); }), search_end);
  print_largest("AES-GCM associated data of one update", largest([&](std::uint32_t size) {
                  return updates(gcm, {}, param_list{}.add_blob(KM_TAG_ASSOCIATED_DATA, bytes(size)), 16);
                }),
                499712);
  blob_ = blob_of(mac.key);
  print_largest("HMAC input of one update",
                largest([&](std::uint32_t size) { return updates(mac, bytes(size), {}, 16); }), search_end);
  blob_ = blob_of(soter_key());
  print_largest("soter message in one update", largest([&](std::uint32_t size) { return states(size, size + 1); }),
                163840);
  print_largest("soter message in updates of 4 KiB", largest([&](std::uint32_t size) { return states(size, 4096); }),
                131072);
  print_largest("application data of generate_key (AES)", largest([&](std::uint32_t size) {
                  const param_list params = aes_key().add_blob(KM_TAG_APPLICATION_DATA, bytes(size));
                  return keymaster_ta.generate(params, size + wide_room) == outcome{};
                }),
                163840);
  print_largest("material of import_key", largest([&](std::uint32_t size) {
                  const param_list params = aes_key();
                  // A wrong size is found once the material is there; only want of memory says -41.
                  return keymaster_ta.import_key(params, bytes(size)).error != KM_ERROR_MEMORY_ALLOCATION_FAILED;
                }),
                499712);
}

}  // namespace
}  // namespace second_platform
