#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {

SoterTest::SoterTest() {
  hosted_tee::world_options options;
  options.state = folder_.path() / "state";
  world_ = hosted_tee::secure_world::open(options);
  world_->device().other_tas = &quil;
  world_->device().text_properties["gpd.tee.trustedos.manufacturer"] = "maker";
  world_->device().text_properties["gpd.tee.trustedos.implementation.version"] = "7.1";
  clock().set_system(start_system);
  ta_.emplace(world_->device());
}

void SoterTest::TearDown() {
  if (soter_ready()) soter_release_resources();
  expect_same(ta_->holdings(), {});
  EXPECT_EQ(quil.open_sessions, 0);
  EXPECT_THAT(quil.complaints, testing::IsEmpty());
}

bytes SoterTest::key_box(std::size_t components) {
  return attestation_key_box(rsa_test_key::of_bits(2048).components(), components);
}

bytes SoterTest::property_box() {
  return soter_property_box();
}

void SoterTest::provision() {
  quil.provision(rsa_test_key::of_bits(2048).components());
}

std::optional<bytes> SoterTest::stored_counter() {
  const auto text = world_->read_object(keymaster_ta, TEE_STORAGE_PRIVATE, {"SOTER_COUNTER_OBJECT", 21});
  if (!text) return std::nullopt;
  return bytes(text->begin(), text->end());
}

void SoterTest::store_counter(const bytes& data) {
  world_->write_object(keymaster_ta, TEE_STORAGE_PRIVATE, {"SOTER_COUNTER_OBJECT", 21},
                       std::string(data.begin(), data.end()));
}

}  // namespace testing_support
