// Memory of every kind and size through a server: it comes and goes whole, and only where it was meant to.
#include <numeric>

#include "tests/remote/server_fixture.h"

namespace hosted_tee::testing {
namespace {

class RemoteMemoryTest : public ServerTest {
 protected:
  RemoteMemoryTest() {
    serve();
    EXPECT_EQ(TEEC_InitializeContext(name().c_str(), &context), TEEC_SUCCESS);
    TEEC_UUID ta{};
    std::memcpy(&ta, &first_ta::uuid, sizeof ta);
    EXPECT_EQ(TEEC_OpenSession(&context, &session, &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, nullptr), TEEC_SUCCESS);
  }
  ~RemoteMemoryTest() override {
    TEEC_CloseSession(&session);
    TEEC_FinalizeContext(&context);
  }

  TEEC_Result invoke() { return TEEC_InvokeCommand(&session, 5, &operation, &origin); }

  /// The TA copies the first slot to the second, each byte plus one.
  void add_one_to_each() {
    first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
      const auto* const from = static_cast<const std::uint8_t*>(params[0].memref.buffer);
      auto* const to = static_cast<std::uint8_t*>(params[1].memref.buffer);
      for (std::uint32_t i = 0; i < params[0].memref.size; ++i) to[i] = static_cast<std::uint8_t>(from[i] + 1);
      params[1].memref.size = params[0].memref.size;
      return TEE_SUCCESS;
    };
  }

  TEEC_Context context{};
  TEEC_Session session{};
  TEEC_Operation operation{};
  std::uint32_t origin = 99;
};

TEST_F(RemoteMemoryTest, TemporaryMemoryOfEverySizeComesBackWhole) {
  add_one_to_each();
  for (const std::size_t size : {0U, 1U, 8191U, 8192U, 8193U, 16384U, 65536U, 300'000U, 5'000'000U, 10U}) {
    bytes in = ::testing_support::pattern(size), out(size + 7, 0xA5), expected = in;
    for (std::uint8_t& byte : expected) ++byte;
    expected.insert(expected.end(), 7, 0xA5);
    operation.paramTypes = TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE, TEEC_NONE);
    operation.params[0].tmpref = {in.empty() ? &in : static_cast<void*>(in.data()), size};
    operation.params[1].tmpref = {out.data(), out.size()};
    EXPECT_EQ(invoke(), TEEC_SUCCESS) << size;
    EXPECT_EQ(operation.params[1].tmpref.size, size);
    EXPECT_EQ(out, expected) << size;
  }
}

TEST_F(RemoteMemoryTest, MoreThanSharedMemoryMayHaveIsRefusedBeforeItIsTouched) {
  std::uint8_t byte = 0;
  operation.paramTypes = TEEC_MEMREF_TEMP_INPUT;
  operation.params[0].tmpref = {&byte, std::size_t{TEEC_CONFIG_SHAREDMEM_MAX_SIZE} + 1};
  EXPECT_EQ(invoke(), TEEC_ERROR_EXCESS_DATA);
  EXPECT_EQ(origin, TEEC_ORIGIN_API);
}

TEST_F(RemoteMemoryTest, AllocatedMemoryIsWhatTheTaSees) {
  TEEC_SharedMemory shared{nullptr, 100'000, TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&context, &shared), TEEC_SUCCESS);
  auto* const memory = static_cast<std::uint8_t*>(shared.buffer);
  first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
    auto* const seen = static_cast<std::uint8_t*>(params[0].memref.buffer);
    EXPECT_EQ(params[0].memref.size, 100'000U);
    EXPECT_EQ(seen[99'999], 9);
    memory[5] = 55;  // what the client writes meanwhile
    EXPECT_EQ(seen[5], 55);
    seen[6] = 66;
    return TEE_SUCCESS;
  };
  memory[99'999] = 9;
  operation.paramTypes = TEEC_MEMREF_WHOLE;
  operation.params[0].memref = {&shared, 0, 0};
  EXPECT_EQ(invoke(), TEEC_SUCCESS);
  EXPECT_EQ(memory[6], 66);
  EXPECT_EQ(status().shared_blocks, 1U);
  TEEC_ReleaseSharedMemory(&shared);
  EXPECT_EQ(shared.buffer, nullptr);
  EXPECT_EQ(status().shared_blocks, 0U);
}

TEST_F(RemoteMemoryTest, OfRegisteredMemoryOnlyThePartIsCopiedInTheDirectionOfItsReference) {
  bytes block(12, 'a');
  TEEC_SharedMemory shared{block.data(), block.size(), TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  const auto run = [&](std::uint32_t type, const char* expected) {
    std::fill(block.begin(), block.end(), 'a');
    std::string seen;
    first.invoke = [&](void*, std::uint32_t, std::uint32_t, TEE_Param* params) {
      auto* const text = static_cast<char*>(params[0].memref.buffer);
      seen.assign(text, params[0].memref.size);
      std::memset(text - 4, 'z', 12);  // a TA that writes beyond its part
      return TEE_SUCCESS;
    };
    operation.paramTypes = type;
    operation.params[0].memref = {&shared, 4, 4};
    EXPECT_EQ(invoke(), TEEC_SUCCESS);
    EXPECT_EQ(std::string(block.begin(), block.end()), expected);
    return seen;
  };
  EXPECT_EQ(run(TEEC_MEMREF_PARTIAL_INPUT, "aaaaaaaaaaaa"), "aaaa");
  EXPECT_EQ(run(TEEC_MEMREF_PARTIAL_OUTPUT, "aaaazzzzaaaa"), "aaaa");
  EXPECT_EQ(run(TEEC_MEMREF_PARTIAL_INOUT, "aaaazzzzaaaa"), "aaaa");
  TEEC_ReleaseSharedMemory(&shared);
  EXPECT_EQ(shared.buffer, block.data());
}

TEST_F(RemoteMemoryTest, WhatNoTaHasWrittenStaysAsItWas) {
  bytes out(100'000, 0xA5);
  operation.paramTypes = TEEC_MEMREF_TEMP_OUTPUT;
  operation.params[0].tmpref = {out.data(), out.size()};
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) -> TEE_Result { TEE_Panic(3); };
  EXPECT_EQ(invoke(), TEEC_ERROR_TARGET_DEAD);
  EXPECT_EQ(out, bytes(100'000, 0xA5));
  operation.params[0].tmpref = {out.data(), 100};
  EXPECT_EQ(invoke(), TEEC_ERROR_TARGET_DEAD);
  EXPECT_EQ(out, bytes(100'000, 0xA5));
}

// The shared memory that serves one operation after the other must not carry bytes from one to the next.
TEST_F(RemoteMemoryTest, OutputThatTheTaLeavesIsNotThatOfAnEarlierOperation) {
  bytes secret(30'000, 'S'), out(30'000, 0xA5);
  operation.paramTypes = TEEC_MEMREF_TEMP_INPUT;
  operation.params[0].tmpref = {secret.data(), secret.size()};
  first.invoke = [](void*, std::uint32_t, std::uint32_t, TEE_Param*) { return TEE_ERROR_GENERIC; };
  EXPECT_EQ(invoke(), TEEC_ERROR_GENERIC);
  operation.paramTypes = TEEC_MEMREF_TEMP_OUTPUT;
  operation.params[0].tmpref = {out.data(), out.size()};
  EXPECT_EQ(invoke(), TEEC_ERROR_GENERIC);
  EXPECT_EQ(origin, TEEC_ORIGIN_TRUSTED_APP);
  EXPECT_EQ(out, bytes(30'000, 0xA5));
  EXPECT_EQ(operation.params[0].tmpref.size, 30'000U);

  bytes own(100, 'S');
  TEEC_SharedMemory shared{own.data(), own.size(), TEEC_MEM_INPUT | TEEC_MEM_OUTPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  operation.params[0].memref = {&shared, own.size(), 0};
  operation.paramTypes = TEEC_MEMREF_PARTIAL_INPUT;
  EXPECT_EQ(invoke(), TEEC_ERROR_GENERIC);
  std::fill(own.begin(), own.end(), 0xA5);
  operation.paramTypes = TEEC_MEMREF_PARTIAL_OUTPUT;
  EXPECT_EQ(invoke(), TEEC_ERROR_GENERIC);
  EXPECT_EQ(own, bytes(100, 0xA5));
  TEEC_ReleaseSharedMemory(&shared);
}

// Else nobody could try again with the same operation: its sizes would be gone.
TEST_F(RemoteMemoryTest, WhatTheServerRefusesLeavesTheOperationAsItWas) {
  TEEC_CloseSession(&session);
  TEEC_FinalizeContext(&context);
  serve({.sessions = 1});
  ASSERT_EQ(TEEC_InitializeContext(name().c_str(), &context), TEEC_SUCCESS);
  TEEC_UUID ta{};
  std::memcpy(&ta, &first_ta::uuid, sizeof ta);
  ASSERT_EQ(TEEC_OpenSession(&context, &session, &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, nullptr), TEEC_SUCCESS);
  bytes out(30'000, 0xA5);
  const auto fill = [&] {
    operation = {};
    operation.paramTypes =
        TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_VALUE_OUTPUT, TEEC_MEMREF_TEMP_INOUT);
    operation.params[0].value = {42, 43};
    operation.params[1].tmpref = {out.data(), 15'000};
    operation.params[2].value = {44, 45};
    operation.params[3].tmpref = {out.data() + 15'000, 1'000};
  };
  const auto expect_untouched = [&] {
    EXPECT_EQ(origin, TEEC_ORIGIN_COMMS);
    EXPECT_EQ(operation.params[0].value.a, 42U);
    EXPECT_EQ(operation.params[0].value.b, 43U);
    EXPECT_EQ(operation.params[1].tmpref.size, 15'000U);
    EXPECT_EQ(operation.params[2].value.a, 44U);
    EXPECT_EQ(operation.params[3].tmpref.size, 1'000U);
    EXPECT_EQ(out, bytes(30'000, 0xA5));
  };
  fill();
  TEEC_Session second_session{};
  EXPECT_EQ(TEEC_OpenSession(&context, &second_session, &ta, TEEC_LOGIN_PUBLIC, nullptr, &operation, &origin),
            TEEC_ERROR_BUSY);
  expect_untouched();
  const std::uint32_t strangers = 0x7FFFFFF0;
  fill();
  EXPECT_EQ(TEEC_OpenSession(&context, &second_session, &ta, TEEC_LOGIN_GROUP, &strangers, &operation, &origin),
            TEEC_ERROR_ACCESS_DENIED);
  expect_untouched();
  EXPECT_EQ(second_session.imp, nullptr);
}

TEST_F(RemoteMemoryTest, MemoryThatGrewSinceItWasRegisteredIsRefused) {
  bytes block(100);
  TEEC_SharedMemory shared{block.data(), 10, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_RegisterSharedMemory(&context, &shared), TEEC_SUCCESS);
  shared.size = 100;
  operation.paramTypes = TEEC_MEMREF_WHOLE;
  operation.params[0].memref = {&shared, 0, 0};
  EXPECT_EQ(invoke(), TEEC_ERROR_BAD_PARAMETERS);
  TEEC_ReleaseSharedMemory(&shared);
}

TEST_F(RemoteMemoryTest, MemoryOutlivesItsContextWithoutHarm) {
  TEEC_Context other{};
  ASSERT_EQ(TEEC_InitializeContext(name().c_str(), &other), TEEC_SUCCESS);
  TEEC_SharedMemory shared{nullptr, 10, TEEC_MEM_INPUT, {}};
  ASSERT_EQ(TEEC_AllocateSharedMemory(&other, &shared), TEEC_SUCCESS);
  TEEC_FinalizeContext(&other);
  static_cast<std::uint8_t*>(shared.buffer)[9] = 1;
  TEEC_ReleaseSharedMemory(&shared);
}

TEST_F(RemoteMemoryTest, ThreadsOfOneContextGetTheirOwnAnswers) {
  add_one_to_each();
  std::vector<std::thread> threads;
  for (std::uint8_t seed = 0; seed < 4; ++seed) {
    threads.emplace_back([&, seed] {
      for (int i = 0; i < 200; ++i) {
        bytes in(static_cast<std::size_t>(i) * 200, seed), out(in.size() + 1);
        TEEC_Operation own{};
        own.paramTypes = TEEC_PARAM_TYPES(TEEC_MEMREF_TEMP_INPUT, TEEC_MEMREF_TEMP_OUTPUT, TEEC_NONE, TEEC_NONE);
        own.params[0].tmpref = {in.data(), in.size()};
        own.params[1].tmpref = {out.data(), out.size()};
        ASSERT_EQ(TEEC_InvokeCommand(&session, 5, &own, nullptr), TEEC_SUCCESS);
        out.resize(own.params[1].tmpref.size);
        ASSERT_EQ(out, bytes(in.size(), static_cast<std::uint8_t>(seed + 1)));
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
}

}  // namespace
}  // namespace hosted_tee::testing
