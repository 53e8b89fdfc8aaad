// A device that holds a key which the `openssl` command knows too.
#ifndef TESTS_OPENSSL_OPENSSL_FIXTURE_H_
#define TESTS_OPENSSL_OPENSSL_FIXTURE_H_

#include <map>
#include <random>
#include <string>
#include <vector>

#include "tests/openssl/openssl_command.h"
#include "tests/support/device_fixture.h"

namespace testing_support {

/// A digest under both its names.
struct digest_name {
  std::uint32_t digest;
  std::string option;  // of openssl dgst
  std::size_t size;
};
extern const std::vector<digest_name> all_digests;

/// The key of tests/data of a size, in a file for openssl and as a blob for the TA.
class OpensslTest : public DeviceTest {
 protected:
  /// The blob of the fixed key of that size; key_file is openssl's, absolute.
  bytes blob_of(unsigned bits);
  static std::string key_file(unsigned bits);

  /// A file of the test's own, which openssl finds by its bare name.
  [[nodiscard]] std::filesystem::path file(const std::string& name) const { return tee.folder() / name; }
  openssl_result run(const std::vector<std::string>& arguments) { return openssl(tee.folder(), arguments); }

  /// sign_in_ta and verifies_in_ta run a whole operation; a refusal that is not the verdict fails the test.
  bytes sign_in_ta(const bytes& blob, std::uint32_t digest, std::uint32_t padding, const bytes& message);
  bool verifies_in_ta(const bytes& blob, std::uint32_t digest, std::uint32_t padding, const bytes& message,
                      const bytes& signature);

  /// Messages of lengths that are new for every use and the same in every run.
  bytes random_message(std::size_t most);

 private:
  std::map<unsigned, bytes> blobs_;
  std::mt19937 random_{20231114};
};

}  // namespace testing_support

#endif  // TESTS_OPENSSL_OPENSSL_FIXTURE_H_
