// Files of published test vectors, in the JSON form of the Wycheproof project.
#ifndef TESTS_VECTORS_VECTOR_FILE_H_
#define TESTS_VECTORS_VECTOR_FILE_H_

#include <functional>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>

#include "tests/support/bytes.h"

namespace testing_support {

/// What a vector says about its signature.
enum class verdict { valid, acceptable, invalid };

struct vector_case {
  int id = 0;
  std::string comment;
  std::string flags;  // comma-separated
  bytes message;
  bytes signature;
  verdict expected = verdict::invalid;
};

/// read_vectors reads the file `name` in the folder KEYMASTER_VECTORS. Nothing when the variable is unset. Who names a
/// folder wants its vectors run: a file that is missing or doesn't parse throws, and so fails the test.
std::optional<nlohmann::json> read_vectors(const std::string& name);

inline constexpr const char* no_vectors = "skipped: KEYMASTER_VECTORS is not set";

/// for_each_case hands every case of a test group to `check`.
void for_each_case(const nlohmann::json& group, const std::function<void(const vector_case&)>& check);

/// public_material is import material around a public key. The vectors have nothing else, and verification uses nothing
/// else: the private components are placeholders, which the platform takes since it checks no relation between them.
bytes public_material(const nlohmann::json& group);

/// private_material is the import material of a group's key pair, taken apart by libcrypto.
bytes private_material(const nlohmann::json& group);

}  // namespace testing_support

#endif  // TESTS_VECTORS_VECTOR_FILE_H_
