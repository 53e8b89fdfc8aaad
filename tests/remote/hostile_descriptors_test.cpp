// Clients that pass descriptors that nobody asked for, or that are not what they should be.
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

using remote::frame_kind;
using remote::refusal;

constexpr std::uint32_t page = 4096;
constexpr int all_seals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;

file_descriptor made_file(std::size_t size, int seals) {
  file_descriptor file(::memfd_create("test", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  EXPECT_EQ(::ftruncate(file.get(), static_cast<off_t>(size)), 0);
  EXPECT_EQ(::fcntl(file.get(), F_ADD_SEALS, seals), 0);
  return file;
}

class HostileDescriptorsTest : public ServerTest {
 protected:
  HostileDescriptorsTest() {
    serve();
    client = greeted();
  }

  remote::share_answer share(int file, std::uint32_t size = page, std::uint32_t flags = TEEC_MEM_INPUT) {
    return client->ask<remote::share_answer>(frame_kind::share_memory, remote::share_request{size, flags}, {file});
  }

  std::unique_ptr<raw_client> client;
};

TEST_F(HostileDescriptorsTest, DescriptorsThatNobodyAskedForAreClosedWithTheConnection) {
  const bytes share_frame = raw_frame(frame_kind::share_memory, body_of(remote::share_request{page, 1}));
  const file_descriptor file = made_file(page, all_seals);
  const belongings before = current_belongings();
  for (const std::size_t count : {1U, 2U, 3U, 253U}) {
    const auto other = greeted();
    EXPECT_EQ(other->refusal_after(raw_frame(frame_kind::status), std::vector<int>(count, file.get())),
              refusal::malformed);
  }
  for (const std::size_t count : {0U, 2U, 3U, 253U}) {
    const auto other = greeted();
    EXPECT_EQ(other->refusal_after(share_frame, std::vector<int>(count, file.get())), refusal::malformed) << count;
  }
  raw_client ungreeted(path());
  EXPECT_EQ(ungreeted.refusal_after(raw_frame(frame_kind::hello), {file.get()}), refusal::malformed);
  ungreeted.close();
  EXPECT_TRUE(eventually([&] { return current_belongings() == before; }));
  expect_served();
}

TEST_F(HostileDescriptorsTest, FilesThatCouldBeCutShortAreRefused) {
  for (const int seals : {0, F_SEAL_GROW, F_SEAL_GROW | F_SEAL_SEAL, F_SEAL_SHRINK, F_SEAL_SHRINK | F_SEAL_GROW}) {
    EXPECT_EQ(share(made_file(page, seals).get()).done.result, TEEC_ERROR_BAD_PARAMETERS) << seals;
  }
  expect_served();
}

TEST_F(HostileDescriptorsTest, FilesOfOtherKindsAreRefused) {
  std::array<int, 2> pipe{};
  ASSERT_EQ(::pipe2(pipe.data(), O_CLOEXEC), 0);
  const file_descriptor out(pipe[0]), in(pipe[1]);
  const file_descriptor plain(::open((folder.path() / "file").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
  ASSERT_EQ(::ftruncate(plain.get(), page), 0);
  const file_descriptor directory(::open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const file_descriptor zero(::open("/dev/zero", O_RDWR | O_CLOEXEC));
  for (const int file : {out.get(), in.get(), plain.get(), directory.get(), zero.get(), client->socket()}) {
    EXPECT_EQ(share(file).done.result, TEEC_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(HostileDescriptorsTest, FilesThatTheServerCouldNotWriteAreRefused) {
  const file_descriptor file = made_file(page, all_seals);
  const file_descriptor read_only(
      ::open(("/proc/self/fd/" + std::to_string(file.get())).c_str(), O_RDONLY | O_CLOEXEC));
  ASSERT_TRUE(read_only.is_open());
  EXPECT_NE(share(read_only.get()).done.result, TEEC_SUCCESS);
  EXPECT_NE(share(made_file(page, all_seals | F_SEAL_WRITE).get()).done.result, TEEC_SUCCESS);
  EXPECT_NE(share(made_file(page, all_seals | F_SEAL_FUTURE_WRITE).get()).done.result, TEEC_SUCCESS);
}

TEST_F(HostileDescriptorsTest, SizesAndFlagsThatCantBeAreRefused) {
  const file_descriptor file = made_file(page, all_seals);
  for (const std::uint32_t size : {0U, page + 1, 2 * page, TEEC_CONFIG_SHAREDMEM_MAX_SIZE + 1, 0xFFFFFFFFU}) {
    EXPECT_EQ(share(file.get(), size).done.result, TEEC_ERROR_BAD_PARAMETERS) << size;
  }
  for (const std::uint32_t flags : {0U, 4U, 7U, 0x80000001U}) {
    EXPECT_EQ(share(file.get(), page, flags).done.result, TEEC_ERROR_BAD_PARAMETERS) << flags;
  }
  EXPECT_EQ(status().shared_blocks, 0U);
}

TEST_F(HostileDescriptorsTest, WhoWantsToCutItsMemoryShortCant) {
  const file_descriptor file = made_file(2 * page, all_seals);
  const std::uint32_t block = share(file.get(), 2 * page, TEEC_MEM_INPUT | TEEC_MEM_OUTPUT).block;
  EXPECT_NE(::ftruncate(file.get(), 0), 0);
  EXPECT_EQ(errno, EPERM);
  // What can be taken away are the pages: zeros come in their place.
  EXPECT_EQ(::fallocate(file.get(), FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, 0, 2 * page), 0);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    auto* const bytes = static_cast<std::uint8_t*>(params[0].memref.buffer);
    bytes[0] = bytes[2 * page - 1] = 7;
    return TEE_SUCCESS;
  };
  remote::request_slots slots{TEE_PARAM_TYPE_MEMREF_INOUT, {}};
  slots.slots[0] = {0, 0, remote::memory_source::shared, 2 * page, block, 0, {}};
  EXPECT_EQ(client->invoke(client->must_open(first_ta::uuid), slots).done.result, TEEC_SUCCESS);
  std::uint8_t written = 0;
  EXPECT_EQ(::pread(file.get(), &written, 1, 2 * page - 1), 1);
  EXPECT_EQ(written, 7);
}

/// How much memory the file takes.
std::int64_t bytes_of(const file_descriptor& file) {
  struct stat facts {};
  EXPECT_EQ(::fstat(file.get(), &facts), 0);
  return facts.st_blocks * std::int64_t{512};
}

// Pages belong to whoever touched them first, and a client may keep its file.
TEST_F(HostileDescriptorsTest, WhatEndsIsEmptiedSoThatNoFileIsKeptAtTheServersExpense) {
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    std::memset(params[0].memref.buffer, 7, params[0].memref.size);
    return TEE_SUCCESS;
  };
  const auto fill = [&](const file_descriptor& file) {
    remote::request_slots slots{TEE_PARAM_TYPE_MEMREF_INOUT, {}};
    const std::uint32_t block = share(file.get(), 4 * page, TEEC_MEM_INPUT | TEEC_MEM_OUTPUT).block;
    slots.slots[0] = {0, 0, remote::memory_source::shared, 4 * page, block, 0, {}};
    EXPECT_EQ(client->invoke(client->must_open(first_ta::uuid), slots).done.result, TEEC_SUCCESS);
    EXPECT_EQ(bytes_of(file), 4 * page);
    return block;
  };
  const file_descriptor released = made_file(4 * page, all_seals), left = made_file(4 * page, all_seals),
                        slots = made_file(slot_layout{remote::frame_limit}.size(), all_seals),
                        kept = made_file(4 * page, all_seals);
  const std::uint32_t block = fill(released);
  EXPECT_EQ(client->ask<remote::plain_answer>(frame_kind::release_memory, remote::release_request{block}).done.result,
            TEEC_SUCCESS);
  EXPECT_EQ(bytes_of(released), 0);
  (void)fill(left);
  if (frame_channel::wants_slots()) {
    EXPECT_EQ(
        client->ask<remote::plain_answer>(frame_kind::use_slots, remote::empty_request{}, {slots.get()}).done.result,
        TEEC_SUCCESS);
    EXPECT_TRUE(eventually([&] { return bytes_of(slots) > 0; }));  // the server looks for a request there
  }
  client.reset();
  EXPECT_TRUE(has_let_go());
  EXPECT_EQ(bytes_of(left), 0);
  EXPECT_EQ(bytes_of(slots), 0);
  // When the server ends, its clients go on with what they have.
  client = greeted();
  (void)fill(kept);
  server.reset();
  EXPECT_EQ(bytes_of(kept), 4 * page);
}

TEST_F(HostileDescriptorsTest, ReferencesStayInsideTheirBlockAndGoItsWay) {
  const std::uint32_t block = share(made_file(page, all_seals).get()).block;
  const std::uint32_t session = client->must_open(first_ta::uuid);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return ADD_FAILURE(), TEE_SUCCESS; };
  const auto result_of = [&](std::uint32_t type, std::uint32_t number, std::uint32_t offset, std::uint32_t size) {
    remote::request_slots slots{type, {}};
    slots.slots[0] = {0, 0, remote::memory_source::shared, size, number, offset, {}};
    return client->invoke(session, slots).done.result;
  };
  constexpr std::uint32_t in = TEE_PARAM_TYPE_MEMREF_INPUT;
  for (const auto& [offset, size] : {std::pair<std::uint32_t, std::uint32_t>{0, page + 1},
                                     {page, 1},
                                     {page + 1, 0},
                                     {1, 0xFFFFFFFF},
                                     {0xFFFFFFFF, 1},
                                     {0xFFFFFFFF, 0xFFFFFFFF}}) {
    EXPECT_EQ(result_of(in, block, offset, size), TEEC_ERROR_BAD_PARAMETERS) << offset << " " << size;
  }
  EXPECT_EQ(result_of(in, block + 1, 0, 1), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(result_of(TEE_PARAM_TYPE_MEMREF_OUTPUT, block, 0, 1), TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(result_of(TEE_PARAM_TYPE_MEMREF_INOUT, block, 0, 1), TEEC_ERROR_BAD_PARAMETERS);
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_SUCCESS; };
  EXPECT_EQ(result_of(in, block, page, 0), TEEC_SUCCESS);
  EXPECT_EQ(result_of(in, block, 0, page), TEEC_SUCCESS);
}

TEST_F(HostileDescriptorsTest, BlocksHaveLimitsAndGiveTheirPlaceBack) {
  server_limits limits;
  limits.blocks = 2;
  limits.memory = 3 * page;
  limits.memory_of_all = 4 * page;
  client.reset();
  serve(limits);
  client = greeted();
  const file_descriptor file = made_file(4 * page, all_seals);
  EXPECT_EQ(share(file.get(), 4 * page).done.result, TEEC_ERROR_OUT_OF_MEMORY);
  const std::uint32_t block = share(file.get(), 2 * page).block;
  EXPECT_EQ(share(file.get(), 2 * page).done.result, TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(share(file.get(), page).done.result, TEEC_SUCCESS);
  EXPECT_EQ(share(file.get(), 1).done.result, TEEC_ERROR_OUT_OF_MEMORY);
  const auto first_client = std::move(client);
  client = greeted();
  EXPECT_EQ(share(file.get(), 2 * page).done.result, TEEC_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(
      first_client->ask<remote::plain_answer>(frame_kind::release_memory, remote::release_request{block}).done.result,
      TEEC_SUCCESS);
  EXPECT_EQ(share(file.get(), 2 * page).done.result, TEEC_SUCCESS);
  EXPECT_EQ(status().shared_bytes, 3 * page);
}

TEST_F(HostileDescriptorsTest, ABlockIsItsOwnClientsAlone) {
  const std::uint32_t block = share(made_file(page, all_seals).get()).block;
  const auto thief = greeted();
  EXPECT_EQ(thief->ask<remote::plain_answer>(frame_kind::release_memory, remote::release_request{block}).done.result,
            TEEC_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(status().shared_blocks, 1U);
}

}  // namespace
}  // namespace hosted_tee::testing
