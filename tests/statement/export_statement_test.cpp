// Statements of keys: what is accepted, and which check each departure from it fails.
#include <array>
#include <vector>

#include "tests/statement/hand_made.h"

namespace {

using namespace hand_made;
using namespace keymaster::client;

const std::string& key_member() {
  static const std::string text = "\"pub_key\":\"" + one_line_member(app_key()) + "\"";
  return text;
}

std::string whole_text() {
  return "{\"counter\":7,\"uid\":1000," + key_member() + "}";
}

class ExportStatementTest : public testing::Test {
 protected:
  [[nodiscard]] export_expectations expected() const { return {.signer = attk_, .uid = 1000, .last_counter = 3}; }
  [[nodiscard]] export_facts verify(const bytes& statement) const {
    return verify_export_statement(statement, expected());
  }
  [[nodiscard]] std::string refusal(const bytes& statement) const {
    return check_that_refuses([&] { (void)verify(statement); });
  }
  /// What a statement with this text, rightly signed, is refused for.
  [[nodiscard]] std::string refusal_of_text(std::string_view text) const {
    return refusal(export_statement(text, attestation_key()));
  }

  rsa_public_key attk_ = rsa_public_key::from_pem(public_pem(attestation_key()));
};

TEST_F(ExportStatementTest, AStatementOfTheTaIsBelievedAndTellsItsFacts) {
  const export_facts facts = verify(export_statement(whole_text(), attestation_key()));
  EXPECT_EQ(facts.key, rsa_public_key::from_pem(public_pem(app_key())));
  EXPECT_EQ(facts.counter, 7U);
  EXPECT_EQ(facts.counter_gap, 3U);
  EXPECT_EQ(facts.uid, 1000U);
  EXPECT_EQ(facts.key.pem(), public_pem(app_key()));
}

TEST_F(ExportStatementTest, AnAcceptedKeySignsTheStatementOfTheNext) {
  const std::string text = "{\"counter\":9,\"pub_key\":\"" + one_line_member(foreign_key()) + "\"}";
  const rsa_public_key app = verify(export_statement(whole_text(), attestation_key())).key;
  const bytes statement = export_statement(text, app_key());
  EXPECT_EQ(verify_export_statement(statement, {.signer = app}).key,
            rsa_public_key::from_pem(public_pem(foreign_key())));
  EXPECT_EQ(check_that_refuses([&] { (void)verify_export_statement(statement, {.signer = attk_}); }), "signature");
}

TEST_F(ExportStatementTest, CounterAndUidMayBeAbsent) {
  const export_facts facts =
      verify_export_statement(export_statement("{" + key_member() + "}", attestation_key()), {.signer = attk_});
  EXPECT_FALSE(facts.counter);
  EXPECT_FALSE(facts.counter_gap);
  EXPECT_FALSE(facts.uid);
}

TEST_F(ExportStatementTest, EveryFlippedByteIsRefused) {
  const bytes whole = export_statement(whole_text(), attestation_key());
  for (std::size_t i = 0; i < whole.size(); ++i) {
    for (const int mask : {0x01, 0x20, 0x80}) {
      bytes changed = whole;
      changed[i] ^= static_cast<std::uint8_t>(mask);
      EXPECT_NE(refusal(changed), "accepted") << "byte " << i << " mask " << mask;
    }
  }
}

TEST_F(ExportStatementTest, EveryPrefixAndEveryLongerStatementIsRefusedForItsLayout) {
  bytes whole = export_statement(whole_text(), attestation_key());
  for (std::size_t length = 0; length < whole.size(); ++length) {
    EXPECT_EQ(refusal({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)}), "layout") << length;
  }
  whole.push_back(0);
  EXPECT_EQ(refusal(whole), "layout");
}

TEST_F(ExportStatementTest, LengthsThatWrapAroundAreRefusedForTheLayout) {
  const bytes whole = export_statement(whole_text(), attestation_key());
  for (const std::uint32_t length : {0xFFFFFFFFU, 0xFFFFFFFCU, 0xFFFFFF00U, 0x80000000U, 0U}) {
    bytes changed = whole;
    for (unsigned i = 0; i < 4; ++i) {
      changed[i] = static_cast<std::uint8_t>(length >> (8 * i));
    }
    EXPECT_EQ(refusal(changed), "layout") << length;
  }
}

TEST_F(ExportStatementTest, ASignatureOfAnotherKeyDigestOrPaddingIsRefused) {
  const std::string text = whole_text();
  EXPECT_EQ(refusal(export_statement(text, foreign_key())), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pkcs1(attestation_key(), text, EVP_sha1()))), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pkcs1(attestation_key(), text, EVP_sha512()))), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pss(attestation_key(), text, 32))), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pkcs1(attestation_key(), text + '\0'))), "signature");
}

TEST_F(ExportStatementTest, ANulHasNoPlaceInItsText) {
  EXPECT_EQ(refusal_of_text(whole_text() + '\0'), "shape");
  std::string inside = whole_text();
  inside.insert(1, 1, '\0');
  EXPECT_EQ(refusal_of_text(inside), "shape");
  EXPECT_EQ(refusal_of_text(""), "shape");
  EXPECT_EQ(refusal_of_text(whole_text() + "\n"), "shape");
}

TEST_F(ExportStatementTest, AStatementOfTheOtherKindIsRefusedForItsShape) {
  EXPECT_EQ(refusal(sign_statement("{\"raw\":\"x\"}", attestation_key())), "shape");
  EXPECT_EQ(refusal_of_text("{\"raw\":\"x\"}"), "shape");
}

struct text_row {
  const char* what;
  std::string text;
  const char* check;
};

TEST_F(ExportStatementTest, EveryDepartureFromTheTextFailsTheCheckThatSeesIt) {
  const std::string& key = key_member();
  std::string plain_slashes = whole_text();
  for (std::size_t at = 0; (at = plain_slashes.find("\\/", at)) != std::string::npos;) {
    plain_slashes.erase(at, 1);
  }
  ASSERT_NE(plain_slashes, whole_text()) << "the key has a slash";
  for (const text_row& row : std::vector<text_row>{
           {"swapped", "{\"uid\":1000,\"counter\":7," + key + "}", "members"},
           {"key first", "{" + key + ",\"counter\":7,\"uid\":1000}", "members"},
           {"twice", "{\"counter\":7,\"counter\":7,\"uid\":1000," + key + "}", "members"},
           {"key twice", "{\"counter\":7,\"uid\":1000," + key + "," + key + "}", "members"},
           {"unknown", "{\"counter\":7,\"uid\":1000," + key + ",\"more\":1}", "members"},
           {"without a key", "{\"counter\":7,\"uid\":1000}", "members"},
           {"empty", "{}", "members"},
           {"name in capitals", "{\"Counter\":7,\"uid\":1000," + key + "}", "members"},
           {"counter as text", "{\"counter\":\"7\",\"uid\":1000," + key + "}", "members"},
           {"key as number", "{\"counter\":7,\"uid\":1000,\"pub_key\":1}", "members"},
           {"uid too large", "{\"counter\":7,\"uid\":4294967296," + key + "}", "members"},
           {"counter beyond 64 bits", "{\"counter\":18446744073709551616,\"uid\":1000," + key + "}", "json"},
           {"fraction", "{\"counter\":7.0,\"uid\":1000," + key + "}", "json"},
           {"exponent", "{\"counter\":7e0,\"uid\":1000," + key + "}", "json"},
           {"negative", "{\"counter\":-7,\"uid\":1000," + key + "}", "json"},
           {"negative zero", "{\"counter\":-0,\"uid\":1000," + key + "}", "form"},
           {"leading zero", "{\"counter\":07,\"uid\":1000," + key + "}", "json"},
           {"null", "{\"counter\":null,\"uid\":1000," + key + "}", "json"},
           {"truth", "{\"counter\":true,\"uid\":1000," + key + "}", "json"},
           {"array", "{\"counter\":[7],\"uid\":1000," + key + "}", "json"},
           {"object", "{\"counter\":{},\"uid\":1000," + key + "}", "json"},
           {"in an array", "[{" + key + "}]}", "json"},
           {"blank in front", " " + whole_text(), "form"},
           {"blank inside", "{\"counter\": 7,\"uid\":1000," + key + "}", "form"},
           {"line end inside", "{\n\"counter\":7,\"uid\":1000," + key + "}", "json"},
           {"comma at the end", "{\"counter\":7,\"uid\":1000," + key + ",}", "json"},
           {"two objects", whole_text() + whole_text(), "json"},
           {"byte order mark", "\xEF\xBB\xBF" + whole_text(), "form"},
           {"bare slashes", plain_slashes, "form"},
           {"escaped letter", "{\"c\\u006funter\":7,\"uid\":1000," + key + "}", "form"},
           {"not UTF-8", "{\"counter\":7,\"uid\":1000,\"pub_key\":\"\xC0\xAF\"}", "encoding"},
       }) {
    EXPECT_EQ(refusal_of_text(row.text), row.check) << row.what;
  }
}

TEST_F(ExportStatementTest, ACounterThatHasNotMovedIsRefused) {
  const auto text = [](const char* counter) {
    return "{\"counter\":" + std::string(counter) + ",\"uid\":1000," + key_member() + "}";
  };
  EXPECT_EQ(refusal_of_text(text("3")), "counter");
  EXPECT_EQ(refusal_of_text(text("2")), "counter");
  EXPECT_EQ(refusal_of_text(text("0")), "counter");
  EXPECT_EQ(verify(export_statement(text("4"), attestation_key())).counter_gap, 0U);
  EXPECT_EQ(verify(export_statement(text("18446744073709551615"), attestation_key())).counter_gap,
            18446744073709551611U);
}

TEST_F(ExportStatementTest, AnotherUidThanTheUsersIsRefused) {
  const auto text = [](const std::string& uid) { return "{\"counter\":7," + uid + key_member() + "}"; };
  EXPECT_EQ(refusal_of_text(text("\"uid\":1001,")), "uid");
  EXPECT_EQ(refusal_of_text(text("")), "uid");
  EXPECT_EQ(refusal_of_text(text("\"uid\":4294967295,")), "uid");
  const bytes of_a_user = export_statement(text("\"uid\":1000,"), attestation_key());
  EXPECT_EQ(check_that_refuses([&] { (void)verify_export_statement(of_a_user, {.signer = attk_}); }), "uid");
}

}  // namespace
