// What the library sends to the provisioning TA, and what it makes of the answers.
#include "client/lib/provisioning.h"

#include "client/kmctl/values.h"
#include "client/lib/wire.h"
#include "tests/client/attestation_key_file.h"
#include "tests/client/companion_fixture.h"

namespace {

using namespace keymaster;
using namespace keymaster::client;
using kmctl::parse_hex;

class ProvisioningClientTest : public companion_fixture {
 protected:
  void SetUp() override {
    companion_fixture::SetUp();
    device.emplace(*tee);
  }
  void TearDown() override {
    device.reset();
    companion_fixture::TearDown();
  }
  std::optional<client::provisioning> device;
};

TEST_F(ProvisioningClientTest, TheSessionIsOneWithTheProvisioningTa) {
  EXPECT_EQ(fake_tee::now().opened_tas, std::vector<std::uint32_t>{0xd625ee97});
  fake_tee::now().absent_ta = 0xd625ee97;
  const failure facts = failure_of([&] { const client::provisioning absent(*tee); });
  EXPECT_EQ(facts.kind, error_kind::connection);
  EXPECT_EQ(facts.step, "open_provisioning");
}

TEST_F(ProvisioningClientTest, EachBitOfTheStatusIsOneFact) {
  const auto status_of = [&](std::uint32_t mask) {
    prepare({.slots = {{.slot = 0, .a = mask}}});
    return device->status();
  };
  EXPECT_EQ(status_of(0), provisioning_status{});
  EXPECT_EQ(status_of(0x00000001), provisioning_status{.key = true});
  EXPECT_EQ(status_of(0x00000002), provisioning_status{.data = true});
  EXPECT_EQ(status_of(0x00000004), provisioning_status{.soter_properties = true});
  EXPECT_EQ(status_of(0x00000008), provisioning_status{.cpu_id = true});
  EXPECT_EQ(status_of(0x00000010), provisioning_status{.device_id = true});
  EXPECT_EQ(status_of(0x80000000), provisioning_status{.locked = true});
  EXPECT_EQ(last().command, 14U);
  EXPECT_EQ(last().types, 0x0002U);
}

TEST_F(ProvisioningClientTest, AGeneratedKeyTellsItsPublicHalf) {
  const bytes der = attestation_key_file::public_der();
  prepare({.slots = {{.slot = 1, .body = der}}});
  EXPECT_EQ(device->generate_attk(), der);
  EXPECT_EQ(last().command, 6U);
  EXPECT_EQ(last().types, 0x0061U);
  EXPECT_EQ(last().slots[0].a, 2048U);
  EXPECT_GE(last().slots[1].capacity, 294U);
}

TEST_F(ProvisioningClientTest, APublicHalfThatIsNoneIsAFormatError) {
  bytes too_long = attestation_key_file::public_der();
  too_long.push_back(0);
  for (const bytes& answer : {bytes{}, bytes(294), too_long, bytes(5000)}) {
    prepare({.slots = {{.slot = 1, .body = answer}}});
    EXPECT_THROW((void)device->generate_attk(), format_error) << answer.size();
  }
}

/// An entry of a box: u16 tag, u16 length, the value.
void append_entry(bytes& box, unsigned tag, const bytes& value) {
  append_number(box, tag, 2);
  append_number(box, value.size(), 2);
  append_bytes(box, value);
}

TEST_F(ProvisioningClientTest, AKeyFileBecomesABoxOfItsEightNumbersAndItsPublicHalf) {
  const std::vector<bytes> numbers = attestation_key_file::numbers();
  ASSERT_EQ(numbers.size(), 9U);
  bytes expected;
  for (unsigned i = 1; i < 9; ++i) {
    append_entry(expected, 16 + i, numbers[i]);
  }
  const attestation_key key = read_attestation_key(attestation_key_file::private_pem());
  EXPECT_EQ(bytes(key.box.begin(), key.box.end()), expected);
  EXPECT_EQ(key.public_key, attestation_key_file::public_der());
  device->put_key(key);
  EXPECT_EQ(last().command, 1U);
  EXPECT_EQ(last().types, 0x0005U);
  EXPECT_EQ(last().slots[0].data, expected);
}

TEST_F(ProvisioningClientTest, OnlyAnRsaKeyOf2048BitsIsAnAttestationKey) {
  const pkey_ptr small(EVP_RSA_gen(1024));
  const pkey_ptr curve(EVP_EC_gen("prime256v1"));
  for (const bytes& file : {attestation_key_file::private_pem(small.get()),
                            attestation_key_file::private_pem(curve.get()), bytes{}, bytes(100, 'x')}) {
    EXPECT_THROW((void)read_attestation_key(file), format_error);
  }
}

TEST_F(ProvisioningClientTest, APropertyIsNamedByItsTwoWords) {
  device->put_property(QUIL_PROPERTY_DEVICE_ID, bytes{1, 2});
  EXPECT_EQ(last().command, 11U);
  EXPECT_EQ(last().types, 0x0055U);
  EXPECT_EQ(last().slots[0].data, parse_hex("34193619"));
  EXPECT_EQ(last().slots[1].data, (bytes{1, 2}));
}

TEST_F(ProvisioningClientTest, TheSensorsPropertiesAreABoxWithZeroEndedTextsAndTheUuidAsMemoryHasIt) {
  device->put_soter_properties("FP", "2.0", fingerprint_ta);
  EXPECT_EQ(last().slots[0].data, parse_hex("34180000"));
  EXPECT_EQ(last().slots[1].data, parse_hex("35180300"
                                            "465000"
                                            "36180400"
                                            "322e3000"
                                            "37181000"
                                            "083aa0e84964b245b2759b2df5dd553b"));
}

TEST_F(ProvisioningClientTest, ASensorTextWithAZeroOrWithoutRoomIsNotSent) {
  EXPECT_THROW(device->put_soter_properties(std::string_view("F\0P", 3), "1", fingerprint_ta), std::invalid_argument);
  EXPECT_THROW(device->put_soter_properties("FP", std::string_view("\0", 1), fingerprint_ta), std::invalid_argument);
  // Three headers of 4 bytes, two zeros, the UUID's 16 bytes and "1" leave 481 bytes of 512 for the name.
  device->put_soter_properties(std::string(481, 'x'), "1", fingerprint_ta);
  EXPECT_EQ(last().slots[1].data.size(), 512U);
  EXPECT_THROW(device->put_soter_properties(std::string(482, 'x'), "1", fingerprint_ta), std::invalid_argument);
  EXPECT_THROW(device->put_soter_properties(std::string(70000, 'x'), "1", fingerprint_ta), std::invalid_argument);
  EXPECT_EQ(count(), 1U);
}

TEST_F(ProvisioningClientTest, ACpuIdIsSentWithoutAZero) {
  device->put_cpu_id("4711");
  EXPECT_EQ(last().slots[0].data, parse_hex("34173a17"));
  EXPECT_EQ(last().slots[1].data, (bytes{'4', '7', '1', '1'}));
  device->put_cpu_id(std::string(63, '~'));
  const std::size_t sent = count();
  for (const std::string& id : {std::string(), std::string(64, 'x'), std::string("a\nb"), std::string("\x7f"),
                                std::string("\xc3\xa4"), std::string(1, '\0')}) {
    EXPECT_THROW(device->put_cpu_id(id), std::invalid_argument);
  }
  EXPECT_EQ(count(), sent);
}

TEST_F(ProvisioningClientTest, ADeviceIdHas16To32Bytes) {
  for (const std::size_t size : {16, 32}) {
    device->put_device_id(bytes(size, 0xD1));
    EXPECT_EQ(last().slots[0].data, parse_hex("34193619"));
    EXPECT_EQ(last().slots[1].data, bytes(size, 0xD1));
  }
  for (const std::size_t size : {0, 15, 33}) {
    EXPECT_THROW(device->put_device_id(bytes(size)), std::invalid_argument) << size;
  }
  EXPECT_EQ(count(), 2U);
}

TEST_F(ProvisioningClientTest, ALockHasNoSlots) {
  device->lock();
  EXPECT_EQ(last().command, 13U);
  EXPECT_EQ(last().types, 0U);
}

TEST_F(ProvisioningClientTest, EveryRefusalNamesItsStep) {
  const auto refuse = [](std::uint32_t result) { prepare({.result = result}); };
  refuse(TEEC_ERROR_ACCESS_DENIED);
  expect_refused([&] { (void)device->generate_attk(); }, "generate_attk", TEEC_ERROR_ACCESS_DENIED);
  refuse(TEEC_ERROR_BAD_FORMAT);
  expect_refused([&] { device->put_key({}); }, "put_key", TEEC_ERROR_BAD_FORMAT);
  refuse(TEEC_ERROR_ACCESS_DENIED);
  expect_refused([&] { device->put_cpu_id("1"); }, "put_property", TEEC_ERROR_ACCESS_DENIED);
  refuse(TEEC_ERROR_ACCESS_DENIED);
  expect_refused([&] { device->lock(); }, "lock_device", TEEC_ERROR_ACCESS_DENIED);
  refuse(TEEC_ERROR_BAD_PARAMETERS);
  expect_refused([&] { (void)device->status(); }, "provisioning_status", TEEC_ERROR_BAD_PARAMETERS);
  prepare({.result = TEEC_ERROR_ACCESS_DENIED});
  try {
    device->lock();
  } catch (const error& refused) {
    EXPECT_STREQ(refused.what(), "lock_device failed: TEE_ERROR_ACCESS_DENIED from TRUSTED_APP");
    EXPECT_NE(refused.hint().find("locked"), std::string::npos);
  }
}

}  // namespace
