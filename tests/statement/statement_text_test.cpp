// The texts of statements, beside a reader that others made.
#include "client/lib/statement_text.h"

#include <nlohmann/json.hpp>
#include <random>

#include "tests/statement/hand_made.h"

namespace {

using namespace keymaster::client;

std::string refusal(std::string_view text) {
  return hand_made::check_that_refuses([&] { (void)read_statement_text(text); });
}

TEST(StatementText, IsWrittenWithoutWhitespaceAndWithTheTasEscapes) {
  EXPECT_EQ(write_statement_text({}), "{}");
  EXPECT_EQ(write_statement_text({{"a", std::string("x/y")}, {"b", std::uint64_t{7}}}), R"({"a":"x\/y","b":7})");
  EXPECT_EQ(write_statement_text({{"\"\\/\b\f\n\r\t", std::string("\x01\x7F\u00E9")}}),
            "{\"\\\"\\\\\\/\\b\\f\\n\\r\\t\":\"\x01\x7F\u00E9\"}");
  EXPECT_EQ(write_statement_text({{"n", std::uint64_t{UINT64_MAX}}}), R"({"n":18446744073709551615})");
}

TEST(StatementText, TheMembersAreReadInTheirOrderAndAsOftenAsTheyStandThere) {
  const std::vector<statement_member> members = {
      {"b", std::uint64_t{1}}, {"a", std::string("x\x01/")}, {"b", std::uint64_t{0}}, {"", std::string()}};
  EXPECT_EQ(read_statement_text("{\"b\":1,\"a\":\"x\x01\\/\",\"b\":0,\"\":\"\"}"), members);
}

TEST(StatementText, ABackslashBeforeAControlCharacterEscapesNothing) {
  for (const char character : {'\x01', '\n', '\t', '\x1F'}) {
    const std::string text = std::string("{\"a\":\"\\") + character + "\"}";
    EXPECT_NE(refusal(text), "accepted") << int{character};
  }
}

TEST(StatementText, WhatIsNotAnObjectOfTextsAndNumbersIsNoStatement) {
  for (const char* const text : {"", "{", "}", "7", "\"a\"", "[]", "{\"a\"}", "{\"a\":}", "{\"a\":nul}", "{a:1}",
                                 "{'a':1}", "{\"a\":1}//", "{\"a\":\"\\x\"}", "{\"a\":\"\\u12\"}", "{\"a\":0x1}",
                                 "{\"a\":+1}", "{\"a\":\"\\ud800\"}", "{\"a\":NaN}", "{\"a\":1e999}"}) {
    EXPECT_EQ(refusal(text), "json") << text;
  }
}

TEST(StatementText, DeepNestingEndsAtTheFirstStep) {
  EXPECT_EQ(refusal(std::string(1000000, '[')), "json");
  std::string nested;
  for (int i = 0; i < 200000; ++i) {
    nested += "{\"a\":";
  }
  EXPECT_EQ(refusal(nested), "json");
}

/// A text of letters that need care, UTF-8 of every length among them.
std::string random_text(std::mt19937& random) {
  static const std::vector<std::string> pieces = {"a",  "\"", "\\",   "/",    "\b",     "\f",     "\n",
                                                  "\r", "\t", "\x01", "\x0B", "u",      "{",      "}",
                                                  ":",  ",",  "\x1F", "\x7F", "\u00E9", "\u20AC", "\U0001F600"};
  std::string text;
  for (std::size_t left = random() % 12; left != 0; --left) {
    text += pieces[random() % pieces.size()];
  }
  return text;
}

TEST(StatementText, WhatIsWrittenIsReadBackAndIsJsonOnceItsControlCharactersAreEscaped) {
  std::mt19937 random(20240501);
  for (int round = 0; round < 20000; ++round) {
    std::vector<statement_member> members;
    auto expected = nlohmann::ordered_json::object();
    for (std::size_t left = random() % 6; left != 0; --left) {
      const std::string name = random_text(random) + std::to_string(left);
      statement_value value = random_text(random);
      if (random() % 2 == 0) {
        value = std::uint64_t{random()} << random() % 33;
      }
      std::visit([&](const auto& one) { expected[name] = one; }, value);
      members.push_back({.name = name, .value = value});
    }
    const std::string text = write_statement_text(members);
    ASSERT_EQ(read_statement_text(text), members) << text;
    std::string escaped;
    for (const char character : text) {
      escaped += static_cast<unsigned char>(character) < 0x20 ? "\\u00" + std::string(1, "01"[character >> 4]) +
                                                                    std::string(1, "0123456789abcdef"[character & 15])
                                                              : std::string(1, character);
    }
    ASSERT_EQ(nlohmann::ordered_json::parse(escaped), expected) << text;
  }
}

}  // namespace
