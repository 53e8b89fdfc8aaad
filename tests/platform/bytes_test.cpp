// Owners of heap memory, as the heap that they take from and give back to sees them.
#include "platform/bytes.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class BytesTest : public TaUnitTest {
 protected:
  void SetUp() override {
    ta.on_free([this](std::span<const std::uint8_t> block) { freed.emplace_back(block.begin(), block.end()); });
  }

  std::vector<bytes> freed;  // what the heap got back, as it was at that moment
};

TEST_F(BytesTest, FreshMemoryIsZero) {
  heap_bytes owner;
  ASSERT_TRUE(owner.allocate(100));
  EXPECT_TRUE(owner);
  EXPECT_EQ(owner.size(), 100U);
  EXPECT_EQ(bytes(owner.data(), owner.data() + 100), bytes(100, 0));
}

TEST_F(BytesTest, NoBytesAreABlockAllTheSame) {
  heap_bytes owner;
  ASSERT_TRUE(owner.allocate(0));
  EXPECT_TRUE(owner);
  EXPECT_EQ(owner.size(), 0U);
  EXPECT_TRUE(owner.span().empty());
  EXPECT_EQ(ta.holdings().heap_blocks, 1U);
  ASSERT_TRUE(owner.copy_of({}));
  EXPECT_NE(owner.data(), nullptr);
}

TEST_F(BytesTest, AnExhaustedHeapLeavesTheOwnerEmpty) {
  heap_bytes owner;
  ASSERT_TRUE(owner.allocate(10));
  ta.faults().fail_allocation(1);
  EXPECT_FALSE(owner.allocate(20));
  EXPECT_FALSE(owner);
  EXPECT_EQ(owner.data(), nullptr);
  EXPECT_EQ(owner.size(), 0U);
  EXPECT_EQ(ta.holdings().heap_blocks, 0U) << "the old content went first";
  EXPECT_FALSE(owner.allocate(ta_heap_size));
  ta.faults().fail_allocation(1);
  EXPECT_FALSE(owner.copy_of(pattern(5)));
  EXPECT_FALSE(owner);
}

TEST_F(BytesTest, ACopyIsTheOwners) {
  const bytes source = pattern(33);
  heap_bytes owner;
  ASSERT_TRUE(owner.copy_of(source));
  EXPECT_NE(owner.data(), source.data());
  EXPECT_EQ(bytes(owner.span().begin(), owner.span().end()), source);
}

TEST_F(BytesTest, SecretsAreZeroWhenTheHeapGetsThemBack) {
  {
    secret_bytes owner;
    ASSERT_TRUE(owner.copy_of(pattern(64)));
    ASSERT_TRUE(owner.copy_of(pattern(48)));  // replaced
    owner.reset();
    ASSERT_TRUE(owner.copy_of(pattern(40)));  // destroyed
  }
  EXPECT_THAT(freed, ElementsAre(bytes(64, 0), bytes(48, 0), bytes(40, 0)));
}

TEST_F(BytesTest, AnOwnerGivesBackItsBlockOnce) {
  heap_bytes owner;
  ASSERT_TRUE(owner.copy_of(pattern(8)));
  owner.reset();
  owner.reset();
  EXPECT_EQ(freed.size(), 1U);
  EXPECT_FALSE(owner);
}

TEST_F(BytesTest, MovingLeavesTheSourceEmptyAndFreesNothing) {
  secret_bytes source;
  ASSERT_TRUE(source.copy_of(pattern(16)));
  const std::uint8_t* const block = source.data();
  secret_bytes target{std::move(source)};
  EXPECT_FALSE(source);  // NOLINT(bugprone-use-after-move): that is what is tested
  EXPECT_EQ(source.size(), 0U);
  EXPECT_EQ(target.data(), block);
  EXPECT_EQ(target.size(), 16U);
  EXPECT_THAT(freed, IsEmpty());
}

TEST_F(BytesTest, AssigningWipesAndFreesWhatWasThere) {
  secret_bytes target, source;
  ASSERT_TRUE(target.copy_of(pattern(16)));
  ASSERT_TRUE(source.copy_of(pattern(24)));
  target = std::move(source);
  EXPECT_THAT(freed, ElementsAre(bytes(16, 0)));
  EXPECT_EQ(bytes(target.span().begin(), target.span().end()), pattern(24));
  secret_bytes& same = target;
  target = std::move(same);
  EXPECT_EQ(bytes(target.span().begin(), target.span().end()), pattern(24)) << "assigned to itself";
}

TEST_F(BytesTest, AReleasedBlockIsTheNewOwnersToFree) {
  secret_bytes owner;
  ASSERT_TRUE(owner.copy_of(pattern(16)));
  std::uint8_t* const block = owner.release();
  EXPECT_FALSE(owner);
  EXPECT_EQ(owner.size(), 0U);
  EXPECT_THAT(freed, IsEmpty());
  EXPECT_EQ(bytes(block, block + 16), pattern(16));
  TEE_Free(block);
}

TEST_F(BytesTest, AnAdoptedBlockReplacesTheContent) {
  secret_bytes owner;
  ASSERT_TRUE(owner.copy_of(pattern(16)));
  owner.adopt(heap_copy(pattern(20)), 20);
  EXPECT_THAT(freed, ElementsAre(bytes(16, 0)));
  EXPECT_EQ(owner.size(), 20U);
  owner.reset();
  EXPECT_THAT(freed, ElementsAre(bytes(16, 0), bytes(20, 0)));
}

/// A record that owns heap memory and remembers something secret itself.
struct record {
  secret_bytes owned;
  std::uint64_t secret = 5;
};

TEST_F(BytesTest, ARecordIsValueInitialised) {
  record* const made = new_record<record>();
  ASSERT_NE(made, nullptr);
  EXPECT_EQ(made->secret, 5U);
  EXPECT_FALSE(made->owned);
  delete_record(made);
}

TEST_F(BytesTest, ADeletedRecordFreesItsMembersAndIsWiped) {
  record* const made = new_record<record>();
  ASSERT_NE(made, nullptr);
  ASSERT_TRUE(made->owned.copy_of(pattern(12)));
  made->secret = 0x1122334455667788;
  delete_record(made);
  EXPECT_THAT(freed, ElementsAre(bytes(12, 0), bytes(sizeof(record), 0)));
  delete_record<record>(nullptr);
}

TEST_F(BytesTest, ARecordThatFindsNoRoomIsNull) {
  ta.faults().fail_allocation(1);
  EXPECT_EQ(new_record<record>(), nullptr);
}

}  // namespace
