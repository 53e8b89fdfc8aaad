// Loading the attestation key and the properties, and what a failure leaves.
#include "soter/soter_init.h"

#include <algorithm>
#include <cstring>

#include "soter/finger_id.h"
#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

bytes content(const vlb_t& block) {
  return {block.buf, block.buf + block.length};
}

void expect_nothing_loaded() {
  EXPECT_FALSE(soter_ready());
  for (const vlb_t* const block :
       {&attk_key_pair.n, &attk_key_pair.d, &attk_key_pair.e, &attk_key_pair.p, &attk_key_pair.q, &attk_key_pair.dp,
        &attk_key_pair.dq, &attk_key_pair.qinv, &soter_prop_set.fp_sensor_name, &soter_prop_set.fp_sensor_version,
        &soter_prop_set.cpu_id, &soter_prop_set.tee_name, &soter_prop_set.tee_version}) {
    EXPECT_EQ(block->buf, nullptr);
    EXPECT_EQ(block->length, 0U);
  }
  const TEE_UUID none = {};
  EXPECT_EQ(std::memcmp(&soter_prop_set.fp_uuid, &none, sizeof none), 0);
}

class SoterInitTest : public SoterTest {
 protected:
  void SetUp() override { provision(); }
  TEE_Result load() {
    ta().clear_trace();
    quil.calls.clear();
    return soter_ensure_ready();
  }
  [[nodiscard]] std::vector<std::string> debug() { return ta().traced(trace_level::debug); }
};

TEST_F(SoterInitTest, KeyAndPropertiesAreLoadedOnce) {
  expect_nothing_loaded();
  ASSERT_EQ(load(), TEE_SUCCESS);
  EXPECT_THAT(quil.calls, ElementsAre("2", "12 34180000", "12 34173a17"));
  EXPECT_THAT(quil.capacities, ElementsAre(8192, 512, 64));
  EXPECT_TRUE(soter_ready());
  const rsa_components& key = rsa_test_key::of_bits(2048).components();
  EXPECT_EQ(content(attk_key_pair.n), key[rsa_n]);
  EXPECT_EQ(content(attk_key_pair.e), key[rsa_e]);
  EXPECT_EQ(content(attk_key_pair.d), key[rsa_d]);
  EXPECT_EQ(content(attk_key_pair.p), key[rsa_p]);
  EXPECT_EQ(content(attk_key_pair.q), key[rsa_q]);
  EXPECT_EQ(content(attk_key_pair.dp), key[rsa_dp]);
  EXPECT_EQ(content(attk_key_pair.dq), key[rsa_dq]);
  EXPECT_EQ(content(attk_key_pair.qinv), key[rsa_qinv]);
  EXPECT_EQ(content(soter_prop_set.fp_sensor_name), text_with_nul("sensor/1"));
  EXPECT_EQ(content(soter_prop_set.fp_sensor_version), text_with_nul("2.0"));
  EXPECT_EQ(content(soter_prop_set.cpu_id), from_text("CPU0123"));
  EXPECT_EQ(content(soter_prop_set.tee_name), text_with_nul("maker"));
  EXPECT_EQ(content(soter_prop_set.tee_version), text_with_nul("7.1"));
  EXPECT_EQ(std::memcmp(&soter_prop_set.fp_uuid, &fingerprint_ta, sizeof fingerprint_ta), 0);
  EXPECT_THAT(errors(), IsEmpty());
  EXPECT_THAT(debug(), Contains("Init Soter key pair success\n"));
  EXPECT_THAT(debug(), Contains("Init soter data success\n"));

  EXPECT_EQ(load(), TEE_SUCCESS);
  EXPECT_THAT(quil.calls, IsEmpty());
  EXPECT_THAT(debug(), IsEmpty());
  soter_release_resources();
  expect_nothing_loaded();
}

TEST_F(SoterInitTest, AKeyOfNEAndDIsAKey) {
  quil.key.data = key_box(3);
  ASSERT_EQ(load(), TEE_SUCCESS);
  EXPECT_EQ(attk_key_pair.p.buf, nullptr);
  EXPECT_EQ(attk_key_pair.p.length, 0U);
  EXPECT_EQ(attk_key_pair.qinv.buf, nullptr);
  EXPECT_THAT(debug(), Contains("Get length error for 14\n"));
  EXPECT_THAT(debug(), Contains("This rsa key pair only have n, e, d\n"));
}

TEST_F(SoterInitTest, AnEmptyComponentIsAccepted) {
  quil.key.data =
      join({tlv(17, {}), tlv(18, {}), tlv(19, {}), tlv(20, {}), tlv(21, {}), tlv(22, {}), tlv(23, {}), tlv(24, {})});
  ASSERT_EQ(load(), TEE_SUCCESS);
  EXPECT_NE(attk_key_pair.n.buf, nullptr);
  EXPECT_EQ(attk_key_pair.n.length, 0U);
  EXPECT_NE(attk_key_pair.p.buf, nullptr);
}

TEST_F(SoterInitTest, AMissingComponentFailsTheWholeLoad) {
  const rsa_components& key = rsa_test_key::of_bits(2048).components();
  for (const unsigned missing : {17U, 18U, 19U, 21U, 22U, 23U, 24U}) {
    bytes box;
    for (std::uint16_t tag = 17; tag <= 24; ++tag) {
      if (tag != missing) box = join({box, tlv(tag, key.at(tag - 17U))});
    }
    quil.key.data = box;
    EXPECT_EQ(load(), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_THAT(quil.calls, ElementsAre("2"));
    EXPECT_THAT(errors(), IsEmpty());
    char line[40];
    std::snprintf(line, sizeof line, "Get length error for %x\n", missing);
    EXPECT_THAT(debug(), Contains(line));
    EXPECT_THAT(debug(), Contains("Init Soter key pair fail\n"));
    expect_nothing_loaded();
    expect_same(ta().holdings(), {});
  }
}

TEST_F(SoterInitTest, WhatTheProvisioningTaRefusesIsTheResult) {
  struct row {
    played_quil::response* where;
    const char* line;
  };
  for (const row& each : {row{&quil.key, "Init Soter key pair fail\n"},
                          row{&quil.properties["34180000"], "Init soter data fails, 0xf0001234\n"},
                          row{&quil.properties["34173a17"], "init soter cpuid error 0xf0001234\n"}}) {
    each.where->result = 0xF0001234;
    EXPECT_EQ(load(), 0xF0001234U);
    EXPECT_THAT(debug(), Contains(each.line));
    expect_nothing_loaded();
    expect_same(ta().holdings(), {});
    each.where->result = TEE_SUCCESS;
  }
  EXPECT_THAT(quil.calls, ElementsAre("2", "12 34180000", "12 34173a17")) << "everything was tried again";
  EXPECT_THAT(debug(), Contains("retrieve soter cpu id error 0xf0001234\n"));
}

TEST_F(SoterInitTest, AnAnswerLongerThanTheRoomIsRefused) {
  for (const auto& [where, length] : {std::pair{&quil.key, 8193U}, std::pair{&quil.properties["34180000"], 513U},
                                      std::pair{&quil.properties["34173a17"], 65U}}) {
    where->length = length;
    EXPECT_EQ(load(), TEE_ERROR_SHORT_BUFFER);
    expect_nothing_loaded();
    where->length = 0xFFFFFFFF;
    EXPECT_EQ(load(), TEE_ERROR_SHORT_BUFFER);
    where->length.reset();
  }
  EXPECT_EQ(load(), TEE_SUCCESS);
}

TEST_F(SoterInitTest, ABoxThatDoesntParseIsWantOfMemoryForTheKeyAndGenericForTheProperties) {
  quil.key.data.pop_back();
  EXPECT_EQ(load(), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_THAT(errors(), IsEmpty());
  provision();
  quil.properties["34180000"].data.pop_back();
  EXPECT_EQ(load(), TEE_ERROR_GENERIC);
  EXPECT_THAT(errors(), ElementsAre("parse property tlv box error"));
  expect_nothing_loaded();
}

TEST_F(SoterInitTest, APropertyBoxMustBeComplete) {
  const bytes name = tlv(0x1835, {}), version = tlv(0x1836, {}), uuid = tlv(0x1837, bytes(16));
  struct row {
    bytes box;
    const char* line;
  };
  for (const row& each :
       {row{join({version, uuid}), "tlv_box_get_bytes_ptr error for tag 0x1835\n"},
        row{join({name, uuid}), "tlv_box_get_bytes_ptr error for tag 0x1836\n"},
        row{join({name, version}), "get fp uuid bytes ptr error"},
        row{join({name, version, tlv(0x1837, bytes(15))}), "fp_uuid length unmatch expect 16 actual 15\n"},
        row{join({name, version, tlv(0x1837, bytes(17))}), "fp_uuid length unmatch expect 16 actual 17\n"}}) {
    quil.properties["34180000"].data = each.box;
    EXPECT_EQ(load(), TEE_ERROR_GENERIC);
    EXPECT_THAT(errors(), IsEmpty());
    EXPECT_THAT(debug(), Contains(each.line));
    EXPECT_THAT(debug(), Contains("Init soter data fails, 0xffff0000\n"));
    expect_nothing_loaded();
    expect_same(ta().holdings(), {});
  }
}

TEST_F(SoterInitTest, ACpuIdMayFillItsRoomAndStillEndsInANul) {
  quil.properties["34173a17"].data = bytes(64, 'x');
  ASSERT_EQ(load(), TEE_SUCCESS);
  EXPECT_EQ(soter_prop_set.cpu_id.length, 64U);
  EXPECT_EQ(soter_prop_set.cpu_id.buf[64], 0);
}

TEST_F(SoterInitTest, EveryAllocationThatFailsLeavesNothingAndTheNextLoadSucceeds) {
  int failures = 0;
  while (true) {
    faults().clear();
    faults().fail_allocation(static_cast<unsigned>(failures + 1));
    quil.calls.clear();
    const TEE_Result result = soter_ensure_ready();
    if (result == TEE_SUCCESS) {
      // Entries that find no memory are missed, unless it is p: then the key is one of n, e and d.
      if (!faults().triggered()) break;
      soter_release_resources();
    } else {
      expect_nothing_loaded();
    }
    expect_same(ta().holdings(), {});
    ++failures;
    ASSERT_LT(failures, 200);
  }
  EXPECT_GT(failures, 50);
}

TEST_F(SoterInitTest, AKeyWhosePFindsNoMemoryIsAKeyOfNEAndD) {
  const std::string want_of_memory = "Fail to allocate memory for 14\n";
  for (unsigned n = 1; n < 100; ++n) {
    faults().clear();
    faults().fail_allocation(n);
    const TEE_Result result = load();
    const std::vector<std::string> lines = debug();
    if (std::find(lines.begin(), lines.end(), want_of_memory) != lines.end()) {
      EXPECT_EQ(result, TEE_SUCCESS);
      EXPECT_EQ(attk_key_pair.p.buf, nullptr);
      EXPECT_EQ(attk_key_pair.p.length, 0U);
      EXPECT_EQ(attk_key_pair.q.buf, nullptr);
      EXPECT_EQ(content(attk_key_pair.d), rsa_test_key::of_bits(2048).component(rsa_d));
      EXPECT_THAT(lines, Contains("This rsa key pair only have n, e, d\n"));
      return;
    }
    if (result == TEE_SUCCESS) soter_release_resources();
  }
  FAIL() << "p found memory every time";
}

TEST_F(SoterInitTest, ThePropertiesOfThePlatformAreNeeded) {
  faults().clear();
  ASSERT_EQ(load(), TEE_SUCCESS);
  soter_release_resources();
  faults().fail_call("TEE_GetPropertyAsString", 1, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(load(), TEE_ERROR_SHORT_BUFFER);
  EXPECT_THAT(debug(), Contains("get client id property error, 0xffff0010\n"));
  EXPECT_THAT(debug(), Contains("get_tee_property os manufacturer error 0xffff0010\n"));
  faults().clear();
  faults().fail_call("TEE_GetPropertyAsString", 2, TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(load(), TEE_ERROR_ITEM_NOT_FOUND);
  // The name's failure has a line of its own; the version's has none.
  const std::vector<std::string> lines = debug();
  ASSERT_GE(lines.size(), 2U);
  EXPECT_THAT(std::vector<std::string>(lines.end() - 2, lines.end()),
              ElementsAre("get client id property error, 0xffff0008\n", "Init soter data fails, 0xffff0008\n"));
  expect_nothing_loaded();
}

TEST_F(SoterInitTest, AnInstanceStartsWithoutWhatAnEarlierOneHeld) {
  soter_set_fid(9, 7'200'250);
  std::uint32_t fid = 0;
  ASSERT_EQ(soter_get_fid(&fid), TEE_SUCCESS);
  {
    // An instance that dies takes its heap along, and tells nobody.
    hosted_tee::instance died(keymaster_ta, ta_heap_size, ta().instance().device, faults());
    const hosted_tee::instance_scope scope(died);
    ASSERT_EQ(load(), TEE_SUCCESS);
  }
  soter_start();
  expect_nothing_loaded();
  EXPECT_EQ(soter_get_fid(&fid), TEE_ERROR_TIMEOUT);
  EXPECT_EQ(load(), TEE_SUCCESS);
  EXPECT_THAT(quil.calls, ElementsAre("2", "12 34180000", "12 34173a17"));
}

TEST_F(SoterInitTest, TheKeyIsWipedWhereverItWas) {
  const bytes secret = rsa_test_key::of_bits(2048).component(rsa_d);
  bool left = false;
  ta().on_free(
      [&](std::span<const std::uint8_t> block) { left = left || contains(block, std::span(secret).subspan(100, 16)); });
  ASSERT_EQ(load(), TEE_SUCCESS);
  soter_release_resources();
  EXPECT_FALSE(left);
}

}  // namespace
}  // namespace testing_support
