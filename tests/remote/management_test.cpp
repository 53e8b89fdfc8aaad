// What a server tells of itself, to whom, and how it is ended.
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <tuple>
#include <utility>

#include "tee/runtime/uuid.h"
#include "tests/remote/false_server.h"
#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;

class ManagementTest : public ServerTest {
 protected:
  ManagementTest() { serve(); }

  /// Has a TA trace 5000 lines, numbered from 0.
  void trace_more_than_is_kept() {
    const auto client = greeted();
    const std::uint32_t session = client->must_open(first_ta::uuid);
    first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) {
      for (int i = 0; i < 5000; ++i) tee_trace("function", i, 3, "line\n");
      return TEE_SUCCESS;
    };
    EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);
  }
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

// Of each kind another number, so that none can pass for another.
TEST_F(ManagementTest, TheStatusCountsWhatATaHolds) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result {
    TEE_OperationHandle operation = TEE_HANDLE_NULL;
    TEE_ObjectHandle object = TEE_HANDLE_NULL;
    for (int i = 0; i < 2; ++i) {
      if (TEE_AllocateOperation(&operation, TEE_ALG_SHA256, TEE_MODE_DIGEST, 0) != TEE_SUCCESS) return 1;
    }
    if (TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &object) != TEE_SUCCESS) return 2;
    for (const char* id : {"a", "b", "c"}) {
      if (TEE_CreatePersistentObject(TEE_STORAGE_PRIVATE, id, 1, 0, nullptr, nullptr, 0, &object) != 0) return 3;
    }
    return TEE_SUCCESS;
  };
  const auto client = greeted();
  const std::uint32_t session = client->must_open(first_ta::uuid);
  EXPECT_EQ(client->invoke(session).done.result, TEEC_SUCCESS);
  const server_status now = status();
  ASSERT_EQ(now.tas.size(), 1U);
  EXPECT_EQ(now.tas[0].operations, 2U);
  EXPECT_EQ(now.tas[0].transient_objects, 1U);
  EXPECT_EQ(now.tas[0].persistent_objects, 3U);
  client->close();
  EXPECT_TRUE(has_let_go());
  const auto next = greeted();
  (void)next->must_open(first_ta::uuid);
  const server_status later = status();
  ASSERT_EQ(later.tas.size(), 1U);
  EXPECT_EQ(later.tas[0].operations, 0U);
  EXPECT_EQ(later.tas[0].transient_objects, 0U);
  EXPECT_EQ(later.tas[0].persistent_objects, 0U);
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
  trace_more_than_is_kept();
  server_management management;
  server_log log;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  ASSERT_EQ(management.log(0, log).result, TEEC_SUCCESS);
  EXPECT_EQ(log.lines.size(), 4096U);
  EXPECT_EQ(log.lines.back().line, 4999U);
}

TEST_F(ManagementTest, TheLatestLinesAreThoseThatAreAskedForAndKept) {
  trace_more_than_is_kept();
  const std::uint64_t total = status().trace_total;
  server_management management;
  server_log log;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  constexpr auto cases = std::to_array<std::pair<std::uint64_t, std::size_t>>(
      {{0, 0}, {1, 1}, {20, 20}, {4096, 4096}, {4097, 4096}, {UINT64_MAX, 4096}});
  for (const auto& [asked, given] : cases) {
    ASSERT_EQ(management.latest_log(asked, log).result, TEEC_SUCCESS);
    ASSERT_EQ(log.lines.size(), given) << asked;
    EXPECT_EQ(log.next, total);
    if (log.lines.empty()) continue;
    EXPECT_EQ(log.lines.front().number, total - given);
    EXPECT_EQ(log.lines.back().line, 4999U);
  }
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

/// A server that is never at rest: its trace keeps 4096 lines, has 10,000 at first and `growth` more after each look at
/// it. It ends after a hundred looks.
class BusyServerTest : public ServerTest {
 protected:
  bytes answer(const remote::frame& request) {
    if (++looks > 100) return {};
    const std::uint32_t sequence = request.header.sequence;
    if (request.header.kind == static_cast<std::uint16_t>(frame_kind::status)) {
      remote::status_answer told;
      told.trace_total = std::exchange(total, total + growth);
      return raw_frame(std::uint16_t{0x8010}, body_of(told), sequence);
    }
    remote::log_request asked;
    EXPECT_TRUE(remote::read_body(request.body, asked));
    std::uint64_t next = std::max(asked.from, total - 4096);
    remote::log_answer told{{}, 0, false, {}};
    for (int i = 0; i < 1000 && next < total; ++i) told.lines.push_back({next++, 1, 0, "", "", "line\n"});
    told.next = next;
    total += growth;
    return raw_frame(std::uint16_t{0x8011}, body_of(told), sequence);
  }

  std::uint64_t total = 10000, growth = 0;
  int looks = 0;
};

TEST_F(BusyServerTest, TheLogIsWhatThereWasWhenItWasAskedFor) {
  constexpr auto cases = std::to_array<std::tuple<std::uint64_t, std::uint64_t, std::size_t>>({
      // growth, lines that are asked for, lines that are still there when they are read
      {10, UINT64_MAX, 4086},
      {1000, UINT64_MAX, 3096},
      {1100, UINT64_MAX, 2796},
      {5000, UINT64_MAX, 0},
      {10, 20, 20},
      {4090, 20, 6},
      {5000, 20, 0},
  });
  for (const auto& [each_time, asked, given] : cases) {
    total = 10000, growth = each_time, looks = 0;
    false_server busy(path());
    busy.run([this](const remote::frame& request) { return answer(request); });
    server_management management;
    server_log log;
    ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
    EXPECT_EQ(management.latest_log(asked, log).result, TEEC_SUCCESS);
    EXPECT_EQ(log.lines.size(), given) << each_time << " " << asked;
    EXPECT_EQ(log.next, 10000U);
    EXPECT_TRUE(std::ranges::all_of(log.lines, [](const auto& line) { return line.number < 10000; }));
  }
}

TEST_F(BusyServerTest, AnAnswerThatLeadsNowhereEndsTheConnection) {
  false_server liar(path());
  liar.run([this](const remote::frame& request) {
    if (request.header.kind == static_cast<std::uint16_t>(frame_kind::status) || looks > 100) return answer(request);
    ++looks;
    return raw_frame(std::uint16_t{0x8011}, body_of(remote::log_answer{{}, 7, false, {}}), request.header.sequence);
  });
  server_management management;
  server_log log;
  ASSERT_EQ(management.connect(name()).result, TEEC_SUCCESS);
  const management_failure failed = management.log(7, log);
  EXPECT_EQ(failed.result, TEEC_ERROR_COMMUNICATION);
  EXPECT_EQ(failed.origin, TEEC_ORIGIN_COMMS);
  EXPECT_EQ(looks, 2);
}

}  // namespace
}  // namespace hosted_tee::testing
