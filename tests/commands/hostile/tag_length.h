// A platform that lies about the length of a GCM tag.
#ifndef TESTS_COMMANDS_HOSTILE_TAG_LENGTH_H_
#define TESTS_COMMANDS_HOSTILE_TAG_LENGTH_H_

#include <cstdint>

namespace testing_support {

/// claim_tag_length makes the next TEE_AEEncryptFinal report `length` as the tag's, once.
void claim_tag_length(std::uint32_t length);

}  // namespace testing_support

#endif  // TESTS_COMMANDS_HOSTILE_TAG_LENGTH_H_
