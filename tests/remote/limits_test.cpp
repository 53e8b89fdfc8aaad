// The shares that one user and one process get of what there is.
#include "tee/server/limits.h"

#include <gtest/gtest.h>

#include <array>
#include <memory>
#include <vector>

#include "tee/server/shared_memory.h"

namespace hosted_tee::testing {
namespace {

constexpr std::uint32_t page = 4096;

TEST(LimitsTest, AUserGetsThreeQuartersOfTheConnectionsAndAProcessOne) {
  struct row {
    std::uint32_t all, user, process, kept;
  };
  for (const row& expected : std::array<row, 8>{{{1, 1, 1, 0},
                                                 {2, 2, 1, 0},
                                                 {4, 3, 1, 0},
                                                 {8, 6, 2, 1},
                                                 {20, 15, 5, 2},
                                                 {100, 75, 25, 4},
                                                 {512, 384, 128, 4},
                                                 {10000, 7500, 2500, 4}}}) {
    server_limits limits;
    limits.allow_connections(expected.all);
    EXPECT_EQ(limits.connections, expected.all);
    EXPECT_EQ(limits.connections_per_user, expected.user) << expected.all;
    EXPECT_EQ(limits.connections_per_process, expected.process) << expected.all;
    EXPECT_EQ(limits.connections_kept, expected.kept) << expected.all;
  }
}

TEST(LimitsTest, TheUsualOnesKeepToTheShares) {
  const server_limits usual;
  server_limits limits;
  limits.allow_connections(512);
  limits.allow_memory(256ULL << 20);
  EXPECT_EQ(limits.connections_per_user, usual.connections_per_user);
  EXPECT_EQ(limits.connections_per_process, usual.connections_per_process);
  EXPECT_EQ(limits.connections_kept, usual.connections_kept);
  EXPECT_EQ(limits.memory, usual.memory);
  EXPECT_EQ(limits.memory_per_process, usual.memory_per_process);
  EXPECT_EQ(limits.memory_per_user, usual.memory_per_user);
  EXPECT_EQ(limits.memory_of_all, usual.memory_of_all);
  EXPECT_EQ(usual.memory_of_all, 1ULL << 30);
  EXPECT_EQ(usual.memory_per_user, 768ULL << 20);
  EXPECT_EQ(usual.memory_per_process, 256ULL << 20);
  EXPECT_LE(usual.memory, usual.memory_per_process);  // or no connection could have what it is promised
}

class MemorySharesTest : public ::testing::Test {
 protected:
  MemorySharesTest() { limits.allow_memory(2 * page); }

  /// A connection of a process.
  block_collection& of(uid_t user, pid_t process) {
    connections.push_back(std::make_unique<block_collection>(limits, account, memory_holder{user, process}));
    return *connections.back();
  }

  TEEC_Result share(block_collection& connection, std::uint32_t pages) {
    return connection.add(file.file.get(), pages * page, TEEC_MEM_INPUT, last);
  }

  server_limits limits;
  memory_account account;
  shared_file file = make_shared_file(4 * std::size_t{page});
  std::vector<std::unique_ptr<block_collection>> connections;  // end before the account
  std::uint32_t last = 0;
};

TEST_F(MemorySharesTest, AProcessHasAQuarterHoweverManyConnections) {
  block_collection& first = of(1, 10);
  EXPECT_EQ(share(first, 1), TEEC_SUCCESS);
  block_collection& second = of(1, 10);
  EXPECT_EQ(share(second, 2), TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(share(second, 1), TEEC_SUCCESS);
  EXPECT_EQ(share(of(1, 10), 1), TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(share(of(1, 11), 2), TEEC_SUCCESS);
  EXPECT_EQ(account.bytes(), 4 * page);
  EXPECT_EQ(account.blocks(), 3U);
  second.clear();
  EXPECT_EQ(share(first, 1), TEEC_SUCCESS);
}

TEST_F(MemorySharesTest, AUserHasThreeQuartersHoweverManyProcesses) {
  for (const pid_t process : {10, 11, 12}) EXPECT_EQ(share(of(1, process), 2), TEEC_SUCCESS);
  EXPECT_EQ(share(of(1, 13), 1), TEEC_ERROR_OUT_OF_MEMORY);
  block_collection& other = of(2, 14);
  EXPECT_EQ(share(other, 2), TEEC_SUCCESS);
  EXPECT_EQ(share(of(3, 15), 1), TEEC_ERROR_OUT_OF_MEMORY);  // now all have what there is
  connections[0]->clear();
  EXPECT_EQ(share(of(3, 16), 2), TEEC_SUCCESS);
  other.clear();
  EXPECT_EQ(share(of(1, 13), 2), TEEC_SUCCESS);
}

TEST_F(MemorySharesTest, WhoseEverythingEndsLeavesNothing) {
  for (int round = 0; round < 3; ++round) {
    EXPECT_EQ(share(of(1, 10), 2), TEEC_SUCCESS);
    EXPECT_EQ(share(of(1, 10), 1), TEEC_ERROR_OUT_OF_MEMORY);
    connections.clear();
    EXPECT_EQ(account.bytes(), 0U);
    EXPECT_EQ(account.blocks(), 0U);
  }
}

}  // namespace
}  // namespace hosted_tee::testing
