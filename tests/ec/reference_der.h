// The DER form of EC signatures a second time, written for clarity alone, to judge the TA's by.
#ifndef TESTS_EC_REFERENCE_DER_H_
#define TESTS_EC_REFERENCE_DER_H_

#include <optional>
#include <string>
#include <vector>

#include "tee_internal_api.h"
#include "tests/support/bytes.h"

namespace testing_support {

/// What decoding answers: the result, the traced errors, and the two numbers, right-aligned.
struct decoded {
  TEE_Result result = TEE_SUCCESS;
  std::vector<std::string> lines;
  bytes r, s;

  bool operator==(const decoded&) const = default;
};

/// reference_decode decodes into numbers of `half` bytes. Numbers of a refused form are empty.
decoded reference_decode(const bytes& der, std::size_t half);

/// reference_encode encodes two numbers; nothing where a length of 127 occurs, which the TA can't write.
std::optional<bytes> reference_encode(const bytes& r, const bytes& s);

}  // namespace testing_support

#endif  // TESTS_EC_REFERENCE_DER_H_
