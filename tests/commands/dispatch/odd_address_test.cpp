// Buffers at odd addresses: a client may put them anywhere, and a processor may mind.
#include <algorithm>

#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// A buffer that begins `shift` bytes behind an address divisible by 16.
class shifted {
 public:
  shifted(std::size_t shift, const bytes& content) : shift_(shift), room_(content.size() + 32) {
    std::copy(content.begin(), content.end(), start());
    size_ = static_cast<std::uint32_t>(content.size());
  }

  [[nodiscard]] TEE_Param memref() {
    TEE_Param param = {};
    param.memref.buffer = start();
    param.memref.size = size_;
    return param;
  }
  [[nodiscard]] bytes first(std::size_t size) { return {start(), start() + size}; }

 private:
  std::uint8_t* start() {
    const auto address = reinterpret_cast<std::uintptr_t>(room_.data());
    return room_.data() + (16 - address % 16) % 16 + shift_;
  }

  std::size_t shift_;
  bytes room_;
  std::uint32_t size_ = 0;
};

constexpr std::size_t shifts[] = {0, 1, 2, 3};

class OddAddressTest : public CommandTest {
 protected:
  raw_session session{tee.world()};

  /// list asks for a list of exactly `size` bytes at an odd place.
  bytes list(std::uint32_t command, std::uint32_t algorithm, std::uint32_t purpose, std::size_t shift,
             std::size_t size) {
    shifted place(shift, bytes(size + 1, canary));
    TEE_Param params[4] = {values(algorithm, purpose), {}, place.memref(), {}};
    params[2].memref.size = static_cast<std::uint32_t>(size);
    EXPECT_EQ(session.invoke(command, with_response, params), TEE_SUCCESS);
    EXPECT_EQ(params[0].value.a, 0U);
    EXPECT_EQ(params[2].memref.size, size);
    EXPECT_EQ(place.first(size + 1).back(), canary);
    return place.first(size);
  }

  /// call sends a request and takes the response, both as far off; it answers the response's body.
  bytes call(std::uint32_t command, std::uint32_t a, std::size_t shift, const bytes& request,
             std::uint32_t* b = nullptr) {
    shifted in(shift, request), out(shift, bytes(4096, canary));
    const raw_answer got = session.call(command, a, in.memref(), out.memref());
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, KM_ERROR_OK);
    if (b != nullptr) *b = got.b;
    return out.first(got.size);
  }
};

TEST_F(OddAddressTest, ListsAreWrittenAnywhere) {
  for (const std::size_t shift : shifts) {
    SCOPED_TRACE(shift);
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_ALGO, 0, 0, shift, 16), join({u32(1), u32(32), u32(3), u32(128)}));
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_PADDING_MODE, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, shift, 12),
              join({u32(1), u32(3), u32(5)}));
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_DIGEST, KM_ALGORITHM_RSA, KM_PURPOSE_VERIFY, shift, 28),
              join({u32(0), u32(1), u32(2), u32(3), u32(4), u32(5), u32(6)}));
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT, KM_ALGORITHM_RSA, 0, shift, 4), u32(1));
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT, KM_ALGORITHM_RSA, 0, shift, 4), u32(0));
    EXPECT_EQ(list(KM_COMMAND_GET_SUPPORT_BLK_MODE, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, shift, 0), bytes{});
  }
}

TEST_F(OddAddressTest, AKeyGoesItsWholeWayThroughThem) {
  const rsa_test_key& key = rsa_test_key::of_bits(512);
  const bytes message = from_text("message"), none = param_list{}.marshal();
  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  for (const std::size_t shift : shifts) {
    SCOPED_TRACE(shift);
    const bytes imported =
        call(KM_COMMAND_IMPORT_KEY, 0, shift, join({prefixed(rsa_key(512).marshal()), key.material()}));
    const bytes blob(imported.begin() + 4, imported.begin() + 4 + u32_at(imported, 0));
    EXPECT_EQ(call(KM_COMMAND_EXPORT_KEY, 0, shift, key_body(blob, {}, {})), key.spki());
    EXPECT_EQ(call(KM_COMMAND_GET_KEY_CHARACTER, 0, shift, key_body(blob, {}, {})),
              client().characteristics(blob).body());

    std::uint32_t handle = 0, consumed = 0;
    EXPECT_EQ(
        call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, shift, join({prefixed(blob), prefixed(scheme.marshal())}), &handle),
        u32(0));
    EXPECT_EQ(call(KM_COMMAND_UPDATE, handle, shift, join({prefixed(message), prefixed(none)}), &consumed), bytes{});
    EXPECT_EQ(consumed, message.size());
    EXPECT_EQ(call(KM_COMMAND_FINISH, handle, shift, join({prefixed(bytes{}), prefixed(none)})),
              join({prefixed(key.sign(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN, message)), prefixed(u32(0))}));
  }
}

TEST_F(OddAddressTest, AGeneratedKeyIsWrittenAnywhere) {
  for (const std::size_t shift : shifts) {
    const bytes blob = call(KM_COMMAND_GENERATE_KEY, 0, shift, rsa_key(512).marshal());
    EXPECT_TRUE(client().characteristics(blob).ok());
  }
}

}  // namespace
}  // namespace testing_support
