// What the tests of the key store share: a device with storage, its key storage keys as the device knows them, and the
// blob format done with libcrypto.
#ifndef TESTS_KEYSTORE_KEYSTORE_FIXTURE_H_
#define TESTS_KEYSTORE_KEYSTORE_FIXTURE_H_

#include <memory>
#include <optional>

#include "keystore/key_blob.h"
#include "keystore/key_storage_key.h"
#include "tests/keystore/platform_spy.h"
#include "tests/support/device_fixture.h"
#include "tests/support/ta_scope.h"

namespace testing_support {

/// seal makes a blob with libcrypto alone: the key is HMAC-SHA256(ksk, nonce), the cipher AES-256-GCM without
/// associated data.
[[nodiscard]] bytes seal(std::uint8_t protection, const bytes& ksk, const bytes& nonce, const bytes& iv,
                         const bytes& plaintext);

/// unseal opens a blob with libcrypto alone; nothing when its tag does not verify.
[[nodiscard]] std::optional<bytes> unseal(const bytes& ksk, const bytes& blob);

/// What the key store answers.
struct saved {
  TEE_Result result;
  std::uint32_t length;
  bytes buffer;  // all of it
  [[nodiscard]] bytes blob() const { return {buffer.begin(), buffer.begin() + length}; }
};
struct opened {
  TEE_Result result;
  keymaster::keymaster_error_t error;
  bytes key_data;
  param_list characteristics;
  bool has_key_data, has_characteristics;
};

inline constexpr auto untouched = static_cast<keymaster::keymaster_error_t>(0x5EED);
inline constexpr std::uint8_t filler = 0xA5;

class KeystoreTest : public ::testing::Test {
 protected:
  void SetUp() override { boot(true); }
  void TearDown() override;

  /// boot switches the device on, with or without RPMB storage; start_keys begins the key store and expects success.
  void boot(bool rpmb);
  void start_keys();
  /// reboot is both, after everything that the last instance held was given back.
  void reboot(bool rpmb);

  [[nodiscard]] ta_scope& ta() { return *ta_; }
  [[nodiscard]] hosted_tee::secure_world& world() { return *world_; }
  [[nodiscard]] hosted_tee::fault_plan& faults() { return world_->faults(); }
  [[nodiscard]] std::vector<std::string> errors() const { return ta_->errors(); }

  /// The identifier of the stored KSK, with its terminating zero.
  static constexpr std::string_view ksk_id{"Keymaster KSK", 14};
  [[nodiscard]] std::optional<std::string> stored_ksk();
  void store_ksk(const bytes& data);

  /// The values that the two KSKs must have, from the device's own records.
  [[nodiscard]] bytes derived_value() const;
  [[nodiscard]] bytes rpmb_value();
  /// The value inside a key object.
  [[nodiscard]] static bytes value_of(TEE_ObjectHandle key);

  saved save(const bytes& key_data, const param_list& characteristics, std::size_t capacity = 2000);
  opened open(const bytes& blob);
  bytes must_save(const bytes& key_data, const param_list& characteristics);

  /// A refused save leaves the buffer as it was and nothing behind.
  void expect_not_saved(const saved& answer, TEE_Result result, const std::vector<std::string>& lines);
  /// A refused blob yields neither key data nor characteristics.
  void expect_not_opened(const opened& answer, TEE_Result result, keymaster::keymaster_error_t error,
                         const std::vector<std::string>& lines);

 private:
  temporary_folder folder_;
  std::shared_ptr<hosted_tee::secure_world> world_;
  std::optional<ta_scope> ta_;
};

/// A KeystoreTest whose key store has started, with RPMB.
class BlobTest : public KeystoreTest {
 protected:
  void SetUp() override {
    KeystoreTest::SetUp();
    start_keys();
  }

  const bytes key_data = pattern(70, 5);
  const param_list characteristics = param_list{}
                                         .add(keymaster::KM_TAG_ALGORITHM, keymaster::KM_ALGORITHM_RSA)
                                         .add(keymaster::KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
                                         .add_blob(keymaster::KM_TAG_APPLICATION_ID, pattern(20, 6))
                                         .add_blob(keymaster::KM_TAG_APPLICATION_DATA, pattern(3, 7))
                                         .add_blob(keymaster::KM_TAG_ROOT_OF_TRUST, pattern(32, 8));
  [[nodiscard]] std::size_t blob_size() const { return 101 + key_data.size() + characteristics.marshal().size(); }
};

}  // namespace testing_support

#endif  // TESTS_KEYSTORE_KEYSTORE_FIXTURE_H_
