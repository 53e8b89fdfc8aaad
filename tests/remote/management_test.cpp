// What a server tells of itself, to whom, and how it is ended.
#include <sys/syscall.h>
#include <unistd.h>

#include "tee/runtime/uuid.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;

class ManagementTest : public ServerTest {
 protected:
  ManagementTest() { serve(); }
};

TEST_F(ManagementTest, TheStatusCountsWhatThereIs) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  (void)client->must_open(second_ta::uuid);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    TEE_Free(TEE_Malloc(1000, 0));
    return TEE_Malloc(100, 0) == nullptr ? TEE_ERROR_OUT_OF_MEMORY : TEE_SUCCESS;
  };
  EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);
  const server_status now = status();
  EXPECT_EQ(now.pid, static_cast<std::uint32_t>(::getpid()));
  EXPECT_EQ(now.state, "the test's folder");
  EXPECT_EQ(now.connections, 2U);
  EXPECT_EQ(now.accepted, 2U);
  EXPECT_EQ(now.sessions, 2U);
  EXPECT_EQ(now.commands, 1U);
  ASSERT_EQ(now.tas.size(), 2U);
  EXPECT_EQ(now.tas[0].ta, "7e57a001-0001-4000-8000-000000000001");
  EXPECT_EQ(now.tas[0].sessions, 1U);
  // Each block costs its size, rounded up to 8 bytes, and 16 more.
  EXPECT_EQ(now.tas[0].heap_bytes, 104U + 16);
  EXPECT_EQ(now.tas[0].heap_peak, 1000U + 16);
  EXPECT_EQ(now.tas[0].heap_limit, 4096U);
}

TEST_F(ManagementTest, TheLogComesWholeHoweverLongItIs) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    for (int i = 0; i < 3000; ++i) tee_trace("function", i, 2, "%s %d\n", std::string(80, 'x').c_str(), i);
    return TEE_SUCCESS;
  };
  const std::uint64_t before = status().trace_total;
  EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);
  server_management management;
  server_log log;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  ASSERT_EQ(management.log(before, log).result, TEEC_SUCCESS);
  ASSERT_EQ(log.lines.size(), 3000U);
  for (int i = 0; i < 3000; ++i) {
    const auto& line = log.lines[static_cast<std::size_t>(i)];
    ASSERT_EQ(line.number, before + static_cast<std::uint64_t>(i));
    ASSERT_EQ(line.text, std::string(80, 'x') + " " + std::to_string(i));
  }
  EXPECT_EQ(log.lines[7].prefix, "SCRIPT");
  EXPECT_EQ(log.lines[7].function, "function");
  EXPECT_EQ(log.lines[7].line, 7U);
  EXPECT_EQ(log.lines[7].level, 2U);
  EXPECT_EQ(log.next, before + 3000);
  EXPECT_EQ(status().trace_total, before + 3000);
  ASSERT_EQ(management.log(log.next, log).result, TEEC_SUCCESS);
  EXPECT_TRUE(log.lines.empty());
  ASSERT_EQ(management.log(UINT64_MAX, log).result, TEEC_SUCCESS);
  EXPECT_TRUE(log.lines.empty());
}

TEST_F(ManagementTest, WhatTheTraceHasForgottenIsLeftOut) {
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
    for (int i = 0; i < 5000; ++i) tee_trace("function", i, 3, "line\n");
    return TEE_SUCCESS;
  };
  EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);
  server_management management;
  server_log log;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  ASSERT_EQ(management.log(0, log).result, TEEC_SUCCESS);
  EXPECT_EQ(log.lines.size(), 4096U);
  EXPECT_EQ(log.lines.back().line, 4999U);
}

TEST_F(ManagementTest, StopEndsTheServerAndWaitsForIt) {
  const auto client = greeted();
  (void)client->must_open(first_ta::uuid);
  server_management management;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  std::thread stopper([&] { EXPECT_EQ(management.stop().result, TEEC_SUCCESS); });
  EXPECT_TRUE(client->is_closed());
  server->join();
  EXPECT_FALSE(world->has_instance(first_ta::uuid));
  server.reset();
  stopper.join();
}

TEST_F(ManagementTest, OnlyServersAreManaged) {
  server_management management;
  EXPECT_EQ(management.connect("embedded:" + options.state.string()).result, TEEC_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(management.connect("unix:" + path() + "-").result, TEEC_ERROR_COMMUNICATION);
}

TEST_F(ManagementTest, OtherUsersAreServedAndToldNothing) {
  if (::geteuid() != 0) GTEST_SKIP() << "only root can be somebody else";
  serve({}, 0666);
  std::filesystem::permissions(folder.path(), std::filesystem::perms(0755));
  std::thread([&] {
    constexpr long nobody = 65534;
    ASSERT_EQ(::syscall(SYS_setresuid, -1, nobody, -1), 0);  // of this thread alone
    const auto client = greeted();
    ASSERT_EQ(::syscall(SYS_setresuid, -1, 0, -1), 0);
    const remote::outcome denied{TEEC_ERROR_ACCESS_DENIED, TEEC_ORIGIN_COMMS};
    const auto now = client->ask<remote::status_answer>(frame_kind::status, remote::empty_request{});
    EXPECT_EQ(now.done.result, denied.result);
    EXPECT_EQ(now.pid, 0U);
    EXPECT_EQ(now.state, "");
    const auto log = client->ask<remote::log_answer>(frame_kind::log, remote::log_request{});
    EXPECT_EQ(log.done.result, denied.result);
    EXPECT_TRUE(log.lines.empty());
    EXPECT_EQ(client->ask<remote::plain_answer>(frame_kind::stop, remote::empty_request{}).done.result, denied.result);
    TEE_Identity seen{};
    first.open = [&](std::uint32_t, TEE_Param*, void**) {
      return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", &seen);
    };
    EXPECT_EQ(client->open_session(first_ta::uuid, TEEC_LOGIN_USER).done.result, TEEC_SUCCESS);
    EXPECT_TRUE(same_uuid(seen.uuid, named_uuid("uid=65534;")));
  }).join();
  first.open = [](std::uint32_t, TEE_Param*, void**) { return TEE_SUCCESS; };
  expect_served();
}

}  // namespace
}  // namespace hosted_tee::testing
