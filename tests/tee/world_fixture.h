// A device with two scripted TAs, driven through the secure world's own interface.
#ifndef TESTS_TEE_WORLD_FIXTURE_H_
#define TESTS_TEE_WORLD_FIXTURE_H_

#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "tee/runtime/secure_world.h"
#include "tests/support/device_fixture.h"
#include "tests/tee/scripted_ta.h"

namespace hosted_tee::testing {

using first_ta = scripted_ta<1>;
using second_ta = scripted_ta<2>;

inline constexpr TEE_Identity public_client{TEE_LOGIN_PUBLIC, {}};

/// What a call answered, with its origin.
struct reply {
  TEE_Result result = 0xDEADBEEF;
  std::uint32_t origin = 0;
  std::uint32_t session = 0;

  friend bool operator==(const reply&, const reply&) = default;
};

class WorldTest : public ::testing::Test {
 protected:
  WorldTest() : first(first_ta::install()), second(second_ta::install()) { start(); }

  /// start starts the device (again) in the test's folder.
  void start() {
    world.reset();
    options.state = folder.path() / "state";
    world = secure_world::open(options);
  }

  reply open(const TEE_UUID& ta, std::uint32_t types = 0, TEE_Param* params = nullptr) {
    first_ta::apply();
    second_ta::apply();
    reply r;
    r.result = world->open_session(ta, public_client, types, params, r.session, r.origin);
    return r;
  }

  std::uint32_t must_open(const TEE_UUID& ta) {
    const reply r = open(ta);
    EXPECT_EQ(r.result, TEE_SUCCESS);
    return r.session;
  }

  reply invoke(std::uint32_t session, std::uint32_t command = 0, std::uint32_t types = 0, TEE_Param* params = nullptr) {
    reply r;
    r.result = world->invoke(session, command, types, params, r.origin);
    return r;
  }

  /// in_first runs `code` as a command of a fresh session of the first TA and answers what the command did.
  reply in_first(const std::function<TEE_Result()>& code) {
    first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return code(); };
    const std::uint32_t session = must_open(first_ta::uuid);
    const reply r = invoke(session);
    world->close_session(session);
    return r;
  }

  ::testing_support::temporary_folder folder;
  world_options options;
  ta_script& first;
  ta_script& second;
  std::shared_ptr<secure_world> world;
};

inline constexpr reply dead{TEE_ERROR_TARGET_DEAD, TEE_ORIGIN_TEE, 0};

}  // namespace hosted_tee::testing

#endif  // TESTS_TEE_WORLD_FIXTURE_H_
