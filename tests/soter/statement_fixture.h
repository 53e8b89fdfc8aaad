// A played device whose keys are exported and sign, function by function.
#ifndef TESTS_SOTER_STATEMENT_FIXTURE_H_
#define TESTS_SOTER_STATEMENT_FIXTURE_H_

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "keystore/key_blob.h"
#include "keystore/key_storage_key.h"
#include "params/keymaster_defs.h"
#include "platform/handles.h"
#include "soter/finger_id.h"
#include "soter/resolve_key.h"
#include "soter/soter_enhance.h"
#include "tests/soter/soter_fixture.h"

namespace testing_support {

/// A signed statement, taken apart.
struct statement {
  bytes text, signature;
};
inline statement take_apart(const bytes& packed) {
  const std::size_t length = u32_at(packed, 0);
  EXPECT_LE(4 + length, packed.size());
  const auto end = packed.begin() + 4 + static_cast<std::ptrdiff_t>(length);
  return {{packed.begin() + 4, end}, {end, packed.end()}};
}

inline bytes key_data(unsigned bits) {
  return join({u32(bits), rsa_test_key::of_bits(bits).material()});
}

class SoterStatementTest : public SoterTest {
 protected:
  void SetUp() override {
    provision();
    ASSERT_EQ(keymaster::key_store_init(), TEE_SUCCESS);
    ta().clear_trace();
    faults().clear();
  }
  void TearDown() override {
    keymaster::soter_set_fid(0, 0);
    keymaster::key_store_release();
    SoterTest::TearDown();
  }

  struct exported {
    TEE_Result result;
    bytes output;
    std::uint32_t size;
  };
  exported export_key(const param_list& params, const bytes& data = key_data(1024), std::uint32_t capacity = 4096) {
    const keymaster::parameter_set in = in_ta(params);
    exported got{0, bytes(capacity, 0xEE), capacity};
    ta().clear_trace();
    if (just_before) just_before();
    got.result = keymaster::soter_enhance_export_key(in, data, got.output.data(), &got.size);
    if (got.result == TEE_SUCCESS) got.output.resize(got.size);
    return got;
  }
  void expect_export_fails(const exported& got, TEE_Result result, const std::vector<std::string>& lines) {
    EXPECT_EQ(got.result, result);
    EXPECT_EQ(errors(), lines);
    EXPECT_EQ(got.size, got.output.size());
    EXPECT_EQ(got.output, bytes(got.output.size(), 0xEE));
  }
  bytes blob(const bytes& data, std::uint32_t algorithm = keymaster::KM_ALGORITHM_RSA) {
    return blob_of(data, param_list{}.add(keymaster::KM_TAG_ALGORITHM, algorithm));
  }
  bytes blob_of(const bytes& data, const param_list& characteristics) {
    const keymaster::parameter_set in = in_ta(characteristics);
    bytes sealed(8192);
    std::uint32_t length = 0;
    EXPECT_EQ(keymaster::save_key(data, in, sealed, &length), TEE_SUCCESS);
    sealed.resize(length);
    return sealed;
  }
  std::string pem_member(unsigned bits) {
    const bytes spki = rsa_test_key::of_bits(bits).spki();
    std::string base64;
    static constexpr char letters[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    for (std::size_t i = 0; i < spki.size(); i += 3) {
      std::uint32_t group = 0;
      for (std::size_t j = 0; j < 3; ++j) group = group << 8 | (i + j < spki.size() ? spki[i + j] : 0U);
      for (std::size_t j = 0; j < 4; ++j) {
        const char letter = i + j > spki.size() ? '=' : letters[group >> (18 - 6 * j) & 63];
        base64 += letter == '/' ? std::string("\\/") : std::string(1, letter);
      }
    }
    return "\"pub_key\":\"-----BEGIN PUBLIC KEY-----\\n" + base64 + "\\n-----END PUBLIC KEY-----\"";
  }

  /// The parts of a signing operation as RSA makes them.
  struct signing {
    keymaster::object_handle key;
    keymaster::operation_handle operation, digest_operation;
    bytes buffer;
  };
  void begin(signing& op, std::uint32_t digest = TEE_ALG_SHA256,
             std::uint32_t algorithm = TEE_ALG_RSASSA_PKCS1_V1_5_SHA256) {
    std::uint32_t size = 0;
    op.key.reset(keymaster::resolve_key_from_data(key_data(1024), &size));
    ASSERT_TRUE(op.key);
    ASSERT_EQ(op.operation.allocate(algorithm, TEE_MODE_SIGN, size), TEE_SUCCESS);
    ASSERT_EQ(TEE_SetOperationKey(op.operation.get(), op.key.get()), TEE_SUCCESS);
    ASSERT_EQ(op.digest_operation.allocate(digest, TEE_MODE_DIGEST, 0), TEE_SUCCESS);
    op.buffer.resize(128);
  }
  struct signed_statement {
    TEE_Result result;
    bytes output;
  };
  signed_statement sign(signing& op, std::string_view raw, const param_list& of_key = {},
                        const TEE_Attribute* salt = nullptr) {
    const keymaster::parameter_set set = in_ta(of_key);
    const bytes message = text_with_nul(raw);
    const keymaster::soter_signer signer = {set, op.operation.get(), op.digest_operation.get(), op.buffer, salt};
    keymaster::secret_bytes output;
    ta().clear_trace();
    if (just_before) just_before();
    signed_statement got{keymaster::soter_enhance_sign_finish(signer, {}, {message.data(), raw.size()}, output), {}};
    got.output.assign(output.span().begin(), output.span().end());
    return got;
  }
  signed_statement sign_once(std::string_view raw, const param_list& of_key = {}) {
    signing op;
    begin(op);
    return sign(op, raw, of_key);
  }
  void touch(std::uint32_t fid) {
    const TEE_Time now = clock().system();
    keymaster::soter_set_fid(fid, std::uint64_t{now.seconds} * 1000 + now.millis);
  }

  std::function<void()> just_before;  // the last that happens before a statement is made
  const std::string facts = R"("tee_n":"maker","tee_v":"7.1","fp_n":"sensor\/1","fp_v":"2.0","cpu_id":"CPU0123")";
};

}  // namespace testing_support

#endif  // TESTS_SOTER_STATEMENT_FIXTURE_H_
