// The JSON writer: every byte of its text is signed.
#include "soter/json_writer.h"

#include <nlohmann/json.hpp>
#include <random>

#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

using ::testing::IsEmpty;

/// A root object, and its text.
class JsonWriterTest : public TaUnitTest {
 protected:
  void SetUp() override {
    root = json_value_init_object();
    object = json_value_get_object(root);
    ASSERT_NE(object, nullptr);
  }
  void TearDown() override {
    json_value_free(root);
    EXPECT_THAT(ta.errors(), IsEmpty());
    TaUnitTest::TearDown();
  }
  [[nodiscard]] std::string text() const {
    const json_text made{json_serialize_to_string(root)};
    return made ? made.get() : "(none)";
  }

  json_value* root = nullptr;
  json_object* object = nullptr;
};

TEST_F(JsonWriterTest, AnEmptyObjectIsTwoBraces) {
  EXPECT_EQ(text(), "{}");
  EXPECT_EQ(json_serialization_size(root), 3U);
}

TEST_F(JsonWriterTest, MembersStandInTheOrderInWhichTheyWereSet) {
  EXPECT_EQ(json_object_set_string(object, "b", "x/y"), 0);
  EXPECT_EQ(json_object_set_number(object, "a", 7), 0);
  EXPECT_EQ(json_object_set_string(object, "", ""), 0);
  EXPECT_EQ(text(), R"({"b":"x\/y","a":7,"":""})");
}

TEST_F(JsonWriterTest, EightCharactersAreEscapedAndEveryOtherByteIsWrittenAsItIs) {
  const std::map<char, std::string> escaped = {{'"', "\\\""}, {'\\', "\\\\"}, {'/', "\\/"},  {'\b', "\\b"},
                                               {'\f', "\\f"}, {'\n', "\\n"},  {'\r', "\\r"}, {'\t', "\\t"}};
  for (int code = 1; code < 0x80; ++code) {
    const char character = static_cast<char>(code);
    const auto row = escaped.find(character);
    const std::string expected = row == escaped.end() ? std::string(1, character) : row->second;
    ASSERT_EQ(json_object_set_string(object, "s", std::string(1, character).c_str()), 0);
    EXPECT_EQ(text(), "{\"s\":\"" + expected + "\"}") << code;
  }
  ASSERT_EQ(json_object_set_string(object, "s", "\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80"), 0);
  EXPECT_EQ(text(), "{\"s\":\"\xC3\xA9\xE2\x82\xAC\xF0\x9F\x98\x80\"}");
}

TEST_F(JsonWriterTest, NamesAreEscapedLikeStrings) {
  ASSERT_EQ(json_object_set_number(object, "a/\"b", 1), 0);
  EXPECT_EQ(text(), R"({"a\/\"b":1})");
}

TEST_F(JsonWriterTest, AMemberThatIsSetAgainKeepsItsPlace) {
  ASSERT_EQ(json_object_set_string(object, "a", "long and gone"), 0);
  ASSERT_EQ(json_object_set_number(object, "ab", 2), 0);
  ASSERT_EQ(json_object_set_number(object, "a", 3), 0);
  EXPECT_EQ(text(), R"({"a":3,"ab":2})");
}

TEST_F(JsonWriterTest, WhatIsNoUtf8CantBeSet) {
  ASSERT_EQ(json_object_set_string(object, "a", "kept"), 0);
  const auto before = ta.holdings();
  for (const char* const bad : {"\x80", "a\xC3", "\xC0\xAF", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xFF"}) {
    EXPECT_EQ(json_object_set_string(object, "a", bad), -1);
    EXPECT_EQ(json_object_set_string(object, "b", bad), -1);
  }
  EXPECT_EQ(text(), R"({"a":"kept"})");
  expect_same(ta.holdings(), before);
}

TEST_F(JsonWriterTest, NullArgumentsAreRefused) {
  const auto before = ta.holdings();
  EXPECT_EQ(json_object_set_string(nullptr, "a", "b"), -1);
  EXPECT_EQ(json_object_set_string(object, nullptr, "b"), -1);
  EXPECT_EQ(json_object_set_string(object, "a", nullptr), -1);
  EXPECT_EQ(json_object_set_number(nullptr, "a", 1), -1);
  EXPECT_EQ(json_object_set_number(object, nullptr, 1), -1);
  EXPECT_EQ(json_object_set_value(nullptr, "a", root), -1);
  EXPECT_EQ(json_object_set_value(object, nullptr, root), -1);
  EXPECT_EQ(json_object_set_value(object, "a", nullptr), -1);
  EXPECT_EQ(json_value_get_object(nullptr), nullptr);
  EXPECT_EQ(json_serialization_size(nullptr), 0U);
  EXPECT_EQ(json_serialize_to_string(nullptr), nullptr);
  char buffer[8] = "xxxxxxx";
  EXPECT_EQ(json_serialize_to_buffer(nullptr, buffer, 8), -1);
  EXPECT_EQ(json_serialize_to_buffer(root, nullptr, 8), -1);
  json_value_free(nullptr);
  json_free_serialized_string(nullptr);
  EXPECT_EQ(text(), "{}");
  expect_same(ta.holdings(), before);
}

TEST_F(JsonWriterTest, TheBufferMayBeJustLargeEnough) {
  ASSERT_EQ(json_object_set_string(object, "a", "b\n"), 0);
  const std::string expected = R"({"a":"b\n"})";
  ASSERT_EQ(json_serialization_size(root), expected.size() + 1);
  for (std::uint32_t capacity = 0; capacity <= expected.size(); ++capacity) {
    std::string buffer(expected.size() + 2, '.');
    EXPECT_EQ(json_serialize_to_buffer(root, buffer.data(), capacity), -1);
    EXPECT_EQ(buffer, std::string(expected.size() + 2, '.'));
  }
  std::string buffer(expected.size() + 2, '.');
  EXPECT_EQ(json_serialize_to_buffer(root, buffer.data(), static_cast<std::uint32_t>(expected.size() + 1)), 0);
  EXPECT_EQ(buffer, expected + std::string("\0.", 2));
}

TEST_F(JsonWriterTest, ANumberWithoutATextMakesAnObjectWithoutOne) {
  for (const double number :
       {1e11, -1e10, 1e22, std::numeric_limits<double>::infinity(), std::numeric_limits<double>::quiet_NaN()}) {
    ASSERT_EQ(json_object_set_number(object, "n", number), 0);
    EXPECT_EQ(json_serialization_size(root), 0U);
    char buffer[100];
    EXPECT_EQ(json_serialize_to_buffer(root, buffer, sizeof buffer), -1);
    EXPECT_EQ(json_serialize_to_string(root), nullptr);
  }
  ASSERT_EQ(json_object_set_number(object, "n", 99'999'999'999.0), 0);
  EXPECT_EQ(text(), R"({"n":99999999999})");
}

TEST_F(JsonWriterTest, AnObjectHoldsAtMost960Members) {
  for (int i = 0; i < 960; ++i) ASSERT_EQ(json_object_set_number(object, std::to_string(i).c_str(), i), 0) << i;
  const std::string full = text();
  const auto before = ta.holdings();
  EXPECT_EQ(json_object_set_number(object, "960", 960), -1);
  EXPECT_EQ(json_object_set_string(object, "960", "x"), -1);
  json_value* const more = json_value_init_object();
  EXPECT_EQ(json_object_set_value(object, "960", more), -1);
  json_value_free(more);
  EXPECT_EQ(text(), full);
  expect_same(ta.holdings(), before);
  EXPECT_EQ(json_object_set_number(object, "959", 1), 0);  // one that is there can still be set
  EXPECT_THAT(text(), testing::EndsWith(R"("958":958,"959":1})"));
}

TEST_F(JsonWriterTest, ObjectsNest) {
  json_value* const inner = json_value_init_object();
  json_value* const innermost = json_value_init_object();
  ASSERT_EQ(json_object_set_number(json_value_get_object(inner), "n", 1), 0);
  ASSERT_EQ(json_object_set_value(json_value_get_object(inner), "e", innermost), 0);
  ASSERT_EQ(json_object_set_string(json_value_get_object(inner), "s", "t"), 0);
  ASSERT_EQ(json_object_set_number(object, "before", 0), 0);
  ASSERT_EQ(json_object_set_value(object, "in", inner), 0);
  ASSERT_EQ(json_object_set_number(object, "after", 2), 0);
  EXPECT_EQ(text(), R"({"before":0,"in":{"n":1,"e":{},"s":"t"},"after":2})");
  // An inner object is a value of its own.
  const json_text part{json_serialize_to_string(inner)};
  EXPECT_STREQ(part.get(), R"({"n":1,"e":{},"s":"t"})");
  ASSERT_EQ(json_object_set_number(object, "in", 5), 0);
  EXPECT_EQ(text(), R"({"before":0,"in":5,"after":2})");
}

TEST_F(JsonWriterTest, DeepNestingNeedsNoStack) {
  json_object* at = object;
  for (int depth = 0; depth < 1000; ++depth) {
    json_value* const inner = json_value_init_object();
    ASSERT_EQ(json_object_set_value(at, "o", inner), 0);
    at = json_value_get_object(inner);
  }
  EXPECT_EQ(json_serialization_size(root), 1000 * 6 + 3U);
}

TEST_F(JsonWriterTest, WantOfMemoryLeavesTheObjectAsItWas) {
  for (int members : {0, 1, 15}) {
    json_root target{json_value_init_object()};
    json_object* const of_target = json_value_get_object(target.get());
    for (int i = 0; i < members; ++i) ASSERT_EQ(json_object_set_number(of_target, std::to_string(i).c_str(), i), 0);
    const auto before = ta.holdings();
    int failures = 0;
    while (true) {
      ta.faults().clear();
      ta.faults().fail_allocation(static_cast<unsigned>(failures + 1));
      if (json_object_set_string(of_target, "new", "value") == 0) break;
      ++failures;
      expect_same(ta.holdings(), before);
    }
    ta.faults().clear();
    EXPECT_EQ(failures, members == 1 ? 3 : 5);  // record, text, both arrays where they grow, name
    ta.faults().fail_allocation(1);
    EXPECT_EQ(json_serialize_to_string(target.get()), nullptr);
    ta.faults().clear();
  }
  ta.faults().fail_allocation(1);
  EXPECT_EQ(json_value_init_object(), nullptr);
}

/// An independent writer of the same form.
std::string reference(const std::vector<std::pair<std::string, nlohmann::json>>& members) {
  std::string text = "{";
  for (const auto& [name, value] : members) {
    if (text.size() > 1) text += ',';
    text += nlohmann::json(name).dump(-1, ' ', false) + ':' + value.dump(-1, ' ', false);
  }
  text += '}';
  std::string slashes;
  for (const char character : text) slashes += character == '/' ? std::string("\\/") : std::string(1, character);
  return slashes;
}

TEST_F(JsonWriterTest, RandomObjectsAreWrittenAsAnotherLibraryDoes) {
  std::mt19937 random(75);
  const std::vector<std::string> pieces = {
      "a", "Z", " ", "\"", "\\", "/", "\b", "\f", "\n", "\r", "\t", "\xC3\xA9", "\xE2\x82\xAC", "\xF0\x9F\x98\x80"};
  const auto word = [&](std::size_t most) {
    std::string made;
    for (std::size_t i = random() % (most + 1); i > 0; --i) made += pieces[random() % pieces.size()];
    return made;
  };
  for (int round = 0; round < 100'000; ++round) {
    const json_root target{json_value_init_object()};
    json_object* const of_target = json_value_get_object(target.get());
    std::vector<std::pair<std::string, nlohmann::json>> members;
    for (auto i = random() % 6; i > 0; --i) {
      const std::string name = word(2);
      nlohmann::json value = static_cast<std::int64_t>(random());
      if (random() % 2 == 0) {
        value = word(12);
        ASSERT_EQ(json_object_set_string(of_target, name.c_str(), value.get<std::string>().c_str()), 0);
      } else {
        ASSERT_EQ(json_object_set_number(of_target, name.c_str(), value.get<double>()), 0);
      }
      const auto same = std::find_if(members.begin(), members.end(), [&](auto& each) { return each.first == name; });
      if (same == members.end()) {
        members.emplace_back(name, value);
      } else {
        same->second = value;
      }
    }
    const json_text made{json_serialize_to_string(target.get())};
    ASSERT_EQ(std::string(made.get()), reference(members));
  }
}

}  // namespace
}  // namespace testing_support
