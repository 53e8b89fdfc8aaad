// The TA's coder of EC signatures, called directly.
#ifndef TESTS_EC_DER_FIXTURE_H_
#define TESTS_EC_DER_FIXTURE_H_

#include "algorithms/ec/ec_signature_der.h"
#include "tests/ec/reference_der.h"
#include "tests/support/ta_scope.h"

namespace testing_support {

class DerTest : public TaUnitTest {
 protected:
  /// decode hands the TA a buffer of exactly the input's size, so that a read past its end is an error of the
  /// sanitizer, and halves that are not zero before.
  decoded decode(const bytes& der, std::size_t half) {
    const std::unique_ptr<std::uint8_t[]> exact(new std::uint8_t[der.size()]);
    std::copy(der.begin(), der.end(), exact.get());
    decoded got;
    got.r = got.s = bytes(half, 0xEE);
    ta.clear_trace();
    got.result = keymaster::der_decode_ec_signature({exact.get(), der.size()}, got.r, got.s);
    got.lines = ta.errors();
    if (got.result != TEE_SUCCESS) {
      got.r.clear();
      got.s.clear();
    }
    return got;
  }

  /// encode answers the TA's form, or nothing when it refuses.
  std::optional<bytes> encode(const bytes& r, const bytes& s) {
    keymaster::heap_bytes encoded;
    ta.clear_trace();
    const bool done = keymaster::der_encode_ec_signature(r, s, encoded);
    EXPECT_EQ(done, static_cast<bool>(encoded)) << "a refused encoding is empty";
    EXPECT_EQ(done, ta.errors().empty());
    if (!done) return std::nullopt;
    return bytes(encoded.data(), encoded.data() + encoded.size());
  }
};

}  // namespace testing_support

#endif  // TESTS_EC_DER_FIXTURE_H_
