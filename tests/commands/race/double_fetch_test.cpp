// A client that changes its shared buffers while the TA works on them. Whatever comes out of it is the client's own
// doing, but the TA must stand.
#include <algorithm>
#include <atomic>
#include <chrono>
#include <thread>

#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// Overwrites length words of a buffer with hostile values and back, again and again, on a thread of its own.
class flipping_words {
 public:
  flipping_words(bytes& buffer, std::vector<std::size_t> offsets)
      : thread_([this, &buffer, words = std::move(offsets)] { flip(buffer, words); }) {}
  flipping_words(const flipping_words&) = delete;
  flipping_words& operator=(const flipping_words&) = delete;
  ~flipping_words() {
    stop_ = true;
    thread_.join();
  }

 private:
  static void write(bytes& buffer, std::size_t offset, std::uint32_t value) {
    for (std::size_t i = 0; i < sizeof value; ++i) {
      std::atomic_ref(buffer.at(offset + i)).store(static_cast<std::uint8_t>(value >> (8 * i)));
    }
  }

  void flip(bytes& buffer, const std::vector<std::size_t>& offsets) const {
    std::vector<std::uint32_t> honest;
    for (const std::size_t offset : offsets) honest.push_back(u32_at(buffer, offset));
    for (std::uint32_t turn = 0; !stop_; ++turn) {
      const std::size_t which = turn % offsets.size();
      const std::uint32_t hostile[] = {0xFFFFFFFF,         0,         honest[which] + 1, honest[which] - 1,
                                       honest[which] * 16, 0x7FFFFFF0};
      write(buffer, offsets[which], hostile[(turn / offsets.size()) % std::size(hostile)]);
      std::this_thread::yield();
      write(buffer, offsets[which], honest[which]);
    }
  }

  std::atomic<bool> stop_ = false;
  std::thread thread_;
};

class DoubleFetchTest : public CommandTest {
 protected:
  static constexpr std::chrono::milliseconds bout{250};
  raw_session session{tee.world()};
  const bytes blob = import_fixed(512);
  const std::uint32_t blob_size = static_cast<std::uint32_t>(blob.size());
  bytes response = bytes(8192);

  /// attack repeats `command` on `request` while the words at `offsets` flip, and checks that the TA stands and holds
  /// what it held before.
  template <class Command>
  void attack(bytes& request, std::vector<std::size_t> offsets, Command&& command) {
    const hosted_tee::accounting before = tee.accounting();
    unsigned calls = 0;
    {
      const flipping_words flips(request, std::move(offsets));
      for (const auto end = std::chrono::steady_clock::now() + bout; std::chrono::steady_clock::now() < end; ++calls) {
        const raw_answer got = command();
        ASSERT_NE(got.result, TEE_ERROR_TARGET_DEAD);
        ASSERT_LE(got.size, response.size());
      }
    }
    EXPECT_GT(calls, 0U);
    EXPECT_TRUE(tee.world().has_instance(keymaster_ta));
    expect_same(before);
  }

  void end(const raw_answer& begun) {
    if (begun.result != TEE_SUCCESS || begun.error != KM_ERROR_OK) return;
    EXPECT_TRUE(client().abort(begun.b).ok());
  }
};

TEST_F(DoubleFetchTest, ParametersThatChangeWhileTheyAreRead) {
  bytes request = param_list{}
                      .add(KM_TAG_ALGORITHM, 2)  // refused, but only once all parameters are read
                      .add_blob(KM_TAG_APPLICATION_ID, pattern(40))
                      .add_blob(KM_TAG_APPLICATION_DATA, pattern(50))
                      .marshal();
  attack(request, {0, 4 + 24, 4 + 24 + 16, 4 + 2 * 24 + 40 + 16},
         [&] { return session.call(KM_COMMAND_GENERATE_KEY, 0, memref(request), memref(response)); });
}

TEST_F(DoubleFetchTest, KeyMaterialThatChangesWhileItIsImported) {
  const bytes params = rsa_key(512).marshal();
  bytes request = join({prefixed(params), rsa_test_key::of_bits(512).material()});
  const std::size_t material = 4 + params.size();
  attack(request, {0, 4, material, material + 4 + 64, material + 4 + 64 + 4 + 3, material + 20},
         [&] { return session.call(KM_COMMAND_IMPORT_KEY, 0, memref(request), memref(response)); });
}

TEST_F(DoubleFetchTest, ARequestThatItsOwnResponseOverwrites) {
  const bytes params = rsa_key(512).marshal();
  const bytes honest = join({prefixed(params), rsa_test_key::of_bits(512).material()});
  response = honest;
  response.resize(8192);
  attack(response, {0, 4, 66, 78}, [&] {
    std::copy(honest.begin(), honest.end(), response.begin());
    TEE_Param request = memref(response);
    request.memref.size = static_cast<std::uint32_t>(honest.size());
    return session.call(KM_COMMAND_IMPORT_KEY, 0, request, memref(response));
  });
}

TEST_F(DoubleFetchTest, ABlobThatChangesWhileItIsOpened) {
  bytes request = key_body(blob, {}, {});
  for (const std::uint32_t command : {KM_COMMAND_GET_KEY_CHARACTER, KM_COMMAND_EXPORT_KEY}) {
    attack(request, {0, 4, 70, 81, 97, 200, 4 + blob.size(), 8 + blob.size()},
           [&] { return session.call(command, 0, memref(request), memref(response)); });
  }
}

TEST_F(DoubleFetchTest, ABeginWhoseBlobAndParametersChange) {
  const bytes counted = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 0x7FFFFFFF));
  bytes request = join({prefixed(counted), prefixed(signature(KM_DIGEST_NONE, KM_PAD_NONE).marshal())});
  const std::size_t params = 8 + counted.size();
  attack(request, {0, 4, 97, 8 + counted.size() - 4, params, params + 4, params + 12, params + 28, params + 36}, [&] {
    const raw_answer begun = session.call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, memref(request), memref(response));
    end(begun);
    return begun;
  });
}

TEST_F(DoubleFetchTest, InputThatChangesWhileItIsTaken) {
  for (const param_list& scheme :
       {signature(KM_DIGEST_NONE, KM_PAD_NONE), signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN)}) {
    bytes request = join({prefixed(pattern(60)), prefixed(param_list{}.add_blob(KM_TAG_NONCE, pattern(9)).marshal())});
    attack(request, {0, 10, 64, 68, 88}, [&] {
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, scheme);
      const raw_answer got = session.call(KM_COMMAND_UPDATE, handle, memref(request), memref(response));
      (void)client().abort(handle);
      return got;
    });
  }
}

TEST_F(DoubleFetchTest, ASignatureThatChangesWhileItIsVerified) {
  for (const param_list& scheme :
       {signature(KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN), signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS)}) {
    bytes request = join({prefixed(client().sign(blob, scheme, from_text("message")).data), prefixed(u32(0))});
    attack(request, {0, 4, 40, 68, 72}, [&] {
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, scheme);
      return session.call(KM_COMMAND_FINISH, handle, memref(request), memref(response));
    });
  }
}

TEST_F(DoubleFetchTest, EcMaterialThatChangesWhileItIsImported) {
  const bytes params = ec_key(256).marshal();
  const ec_test_key& key = ec_test_key::of_bits(256);
  bytes request = join({prefixed(params), key.material()});
  const std::size_t material = 4 + params.size(), y = material + 8 + key.fields().x.size();
  attack(request, {0, 4, material, material + 4, y, y + 4 + key.fields().y.size()},
         [&] { return session.call(KM_COMMAND_IMPORT_KEY, 0, memref(request), memref(response)); });
}

TEST_F(DoubleFetchTest, AnEcSignatureThatChangesWhileItIsVerified) {
  // The coder reads lengths of its own inside the signature.
  const ec_test_key& key = ec_test_key::of_bits(256);
  const bytes pair = client().must_import(ec_key(256), key.material());
  bytes request = join({prefixed(key.sign(KM_DIGEST_SHA_2_256, from_text("message"))), prefixed(u32(0))});
  attack(request, {0, 4, 6, 38, 40}, [&] {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, pair, ec_digest(KM_DIGEST_SHA_2_256));
    return session.call(KM_COMMAND_FINISH, handle, memref(request), memref(response));
  });
}

TEST_F(DoubleFetchTest, APlaintextThatChangesWhileItsLastBlockIsReadBack) {
  const bytes key = pattern(16), iv = pattern(16, 2);
  const bytes secret = client().must_import(aes_key(128), key);
  bytes request = join({prefixed(aes_encrypt({KM_MODE_CBC, KM_PAD_PKCS7, key, iv}, pattern(40))), prefixed(u32(0))});
  attack(response, {0, 12, 28, 32, 40, 44}, [&] {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_DECRYPT, secret, cipher(KM_MODE_CBC, KM_PAD_PKCS7, iv));
    const raw_answer got = session.call(KM_COMMAND_UPDATE, handle, memref(request), memref(response));
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.size, 32U);
    const finish_answer done = client().finish(handle);  // right, or without its padding
    EXPECT_EQ(done.result, TEE_SUCCESS);
    EXPECT_LE(done.data.size(), 16U);
    return got;
  });
}

TEST_F(DoubleFetchTest, AMacThatChangesWhileItIsVerified) {
  const bytes secret = client().must_import(hmac_key(KM_DIGEST_SHA_2_256, 256), pattern(32));
  bytes request = join({prefixed(pattern(32)), prefixed(u32(0))});
  attack(request, {0, 4, 32, 36, 40}, [&] {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, secret, hmac_length(256));
    return session.call(KM_COMMAND_FINISH, handle, memref(request), memref(response));
  });
}

}  // namespace
}  // namespace testing_support
