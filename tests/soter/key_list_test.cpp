// The list under the boxes.
#include "soter/key_list.h"

#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// The values that were given back, in order.
std::vector<void*> freed;

class KeyListTest : public TaUnitTest {
 protected:
  void SetUp() override {
    freed.clear();
    list = key_list_create([](void* value) { freed.push_back(value); });
    ASSERT_NE(list, nullptr);
  }
  void TearDown() override {
    if (list != nullptr) key_list_destroy(list);
    TaUnitTest::TearDown();
  }

  std::vector<int> keys() const {
    std::vector<int> found;
    const key_list_node* previous = nullptr;
    for (const key_list_node* node = list->head; node != nullptr; node = node->next) {
      EXPECT_EQ(node->previous, previous);
      previous = node;
      found.push_back(node->key);
    }
    EXPECT_EQ(found.size(), list->count);
    return found;
  }

  int a = 0, b = 0, c = 0, d = 0;
  key_list* list = nullptr;
};

TEST_F(KeyListTest, TheNewestStandsInFront) {
  EXPECT_THAT(keys(), IsEmpty());
  EXPECT_EQ(key_list_add(list, 1, &a), 0);
  EXPECT_EQ(key_list_add(list, 0xFFFF, &b), 0);
  EXPECT_EQ(key_list_add(list, 0, &c), 0);
  EXPECT_THAT(keys(), ElementsAre(0, 0xFFFF, 1));
  EXPECT_THAT(freed, IsEmpty());
}

TEST_F(KeyListTest, AKeyIsTakenOnce) {
  EXPECT_EQ(key_list_add(list, 7, &a), 0);
  EXPECT_EQ(key_list_add(list, 7, &b), -1);
  void* value = nullptr;
  EXPECT_EQ(key_list_get(list, 7, &value), 0);
  EXPECT_EQ(value, &a);
  EXPECT_THAT(keys(), ElementsAre(7));
  EXPECT_THAT(freed, IsEmpty());
}

TEST_F(KeyListTest, AKeyThatIsAbsentIsNotFound) {
  ASSERT_EQ(key_list_add(list, 7, &a), 0);
  void* value = &d;
  EXPECT_EQ(key_list_get(list, 8, &value), -1);
  EXPECT_EQ(value, &d);
  EXPECT_TRUE(key_list_contains(list, 7));
  EXPECT_FALSE(key_list_contains(list, 8));
  EXPECT_EQ(key_list_edit(list, 8, &b), -1);
  EXPECT_EQ(key_list_remove(list, 8), -1);
  EXPECT_THAT(freed, IsEmpty());
}

TEST_F(KeyListTest, EditingGivesNothingBack) {
  ASSERT_EQ(key_list_add(list, 7, &a), 0);
  EXPECT_EQ(key_list_edit(list, 7, &b), 0);
  void* value = nullptr;
  EXPECT_EQ(key_list_get(list, 7, &value), 0);
  EXPECT_EQ(value, &b);
  EXPECT_THAT(freed, IsEmpty());
  EXPECT_EQ(key_list_remove(list, 7), 0);
  EXPECT_THAT(freed, ElementsAre(&b));
}

TEST_F(KeyListTest, RemovingTakesOutTheFirstTheLastAndOneBetween) {
  ASSERT_EQ(key_list_add(list, 1, &a), 0);
  ASSERT_EQ(key_list_add(list, 2, &b), 0);
  ASSERT_EQ(key_list_add(list, 3, &c), 0);
  ASSERT_EQ(key_list_add(list, 4, &d), 0);
  EXPECT_EQ(key_list_remove(list, 3), 0);
  EXPECT_THAT(keys(), ElementsAre(4, 2, 1));
  EXPECT_EQ(key_list_remove(list, 4), 0);
  EXPECT_THAT(keys(), ElementsAre(2, 1));
  EXPECT_EQ(key_list_remove(list, 1), 0);
  EXPECT_THAT(keys(), ElementsAre(2));
  EXPECT_EQ(key_list_remove(list, 2), 0);
  EXPECT_THAT(keys(), IsEmpty());
  EXPECT_THAT(freed, ElementsAre(&c, &d, &a, &b));
  EXPECT_EQ(key_list_add(list, 3, &c), 0);
  EXPECT_THAT(keys(), ElementsAre(3));
}

TEST_F(KeyListTest, DestroyingGivesBackEveryValueOnce) {
  ASSERT_EQ(key_list_add(list, 1, &a), 0);
  ASSERT_EQ(key_list_add(list, 2, &b), 0);
  key_list_destroy(std::exchange(list, nullptr));
  EXPECT_THAT(freed, testing::UnorderedElementsAre(&a, &b));
  expect_same(ta.holdings(), {});
}

TEST_F(KeyListTest, WantOfMemoryIsTracedWithTheRecordsSize) {
  const auto before = ta.holdings();
  ta.faults().fail_allocation(1);
  EXPECT_EQ(key_list_create(nullptr), nullptr);
  EXPECT_THAT(ta.errors(), ElementsAre("Out of memory, need 12B"));
  ta.clear_trace();
  ta.faults().fail_allocation(1);
  EXPECT_EQ(key_list_add(list, 1, &a), -1);
  EXPECT_THAT(ta.errors(), ElementsAre("Out of memory, need 16B"));
  EXPECT_THAT(keys(), IsEmpty());
  expect_same(ta.holdings(), before);
}

}  // namespace
}  // namespace testing_support
