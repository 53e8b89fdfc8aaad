// Statements of signed messages: the challenge, the finger, the user, the counter and the NUL.
#include <vector>

#include "tests/statement/hand_made.h"

namespace {

using namespace hand_made;
using namespace keymaster;
using namespace keymaster::client;

const std::string device_members = R"("tee_n":"maker","tee_v":"4.2","fp_n":"touchy","fp_v":"1","cpu_id":"0011aabb"})";

std::string text_with(const std::string& raw, const std::string& numbers = R"("fid":5,"counter":9,"uid":1000)") {
  return "{\"raw\":\"" + raw + "\"," + numbers + "," + device_members;
}

class SignStatementTest : public testing::Test {
 protected:
  [[nodiscard]] sign_expectations expected() const {
    return {.signer = app_,
            .challenge = "challenge/1",
            .fingers = std::vector<std::uint32_t>{4, 5},
            .uid = 1000,
            .last_counter = 7,
            .device = &device_};
  }
  [[nodiscard]] static std::string refusal(const bytes& statement, const sign_expectations& expected) {
    return check_that_refuses([&] { (void)verify_sign_statement(statement, expected); });
  }
  [[nodiscard]] std::string refusal_of_text(const std::string& text) const {
    return refusal(sign_statement(text, app_key()), expected());
  }

  rsa_public_key app_ = rsa_public_key::from_statement(one_line_pem(app_key()));
  factory_record device_{.device_id = {1},
                         .cpu_id = "0011aabb",
                         .tee_n = "maker",
                         .tee_v = "4.2",
                         .fp_n = "touchy",
                         .fp_v = "1",
                         .attk = ""};
  const std::string good_ = text_with("challenge\\/1");
};

TEST_F(SignStatementTest, AStatementOfTheTaIsBelievedAndTellsItsFacts) {
  const sign_facts facts = verify_sign_statement(sign_statement(good_, app_key()), expected());
  EXPECT_EQ(facts.raw, "challenge/1");
  EXPECT_EQ(facts.fid, 5U);
  EXPECT_EQ(facts.counter, 9U);
  EXPECT_EQ(facts.counter_gap, 1U);
  EXPECT_EQ(facts.uid, 1000U);
  EXPECT_EQ(facts.tee_n, "maker");
  EXPECT_EQ(facts.tee_v, "4.2");
  EXPECT_EQ(facts.fp_n, "touchy");
  EXPECT_EQ(facts.fp_v, "1");
  EXPECT_EQ(facts.cpu_id, "0011aabb");
}

TEST_F(SignStatementTest, EveryFlippedByteIsRefused) {
  const bytes whole = sign_statement(good_, app_key());
  for (std::size_t i = 0; i < whole.size(); ++i) {
    for (const int mask : {0x01, 0x20, 0x80}) {
      bytes changed = whole;
      changed[i] ^= static_cast<std::uint8_t>(mask);
      EXPECT_NE(refusal(changed, expected()), "accepted") << "byte " << i << " mask " << mask;
    }
  }
}

TEST_F(SignStatementTest, EveryPrefixAndEveryLongerStatementIsRefusedForItsLayout) {
  bytes whole = sign_statement(good_, app_key());
  for (std::size_t length = 0; length < whole.size(); ++length) {
    const bytes prefix(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length));
    EXPECT_EQ(refusal(prefix, expected()), "layout") << length;
  }
  whole.push_back(0);
  EXPECT_EQ(refusal(whole, expected()), "layout");
}

TEST_F(SignStatementTest, ItsTextEndsWithItsOnlyNul) {
  EXPECT_EQ(refusal(pack(good_, sign_pkcs1(app_key(), good_)), expected()), "shape");
  EXPECT_EQ(refusal(sign_statement(good_ + '\0', app_key()), expected()), "shape");
  std::string inside = good_;
  inside.insert(inside.find("challenge"), 1, '\0');
  EXPECT_EQ(refusal(sign_statement(inside, app_key()), expected()), "shape");
  EXPECT_EQ(refusal(sign_statement("", app_key()), expected()), "shape");
  // The NUL belongs to what is signed.
  EXPECT_EQ(refusal(pack(good_ + '\0', sign_pkcs1(app_key(), good_)), expected()), "signature");
}

TEST_F(SignStatementTest, AnExportStatementIsRefusedForItsShape) {
  const std::string text = "{\"pub_key\":\"" + one_line_member(app_key()) + "\"}";
  EXPECT_EQ(refusal(export_statement(text, app_key()), expected()), "shape");
  EXPECT_EQ(refusal(sign_statement(text, app_key()), expected()), "shape");
}

TEST_F(SignStatementTest, PssIsAcceptedWithASaltOfAnyLengthAndOnlyWhereItWasAgreed) {
  const std::string text = good_ + '\0';
  sign_expectations pss = expected();
  pss.scheme = {.padding = KM_PAD_RSA_PSS, .digest = KM_DIGEST_SHA_2_256};
  for (const int salt : {0, 1, 20, 32, 222}) {
    EXPECT_EQ(refusal(pack(text, sign_pss(app_key(), text, salt)), pss), "accepted") << salt;
    EXPECT_EQ(refusal(pack(text, sign_pss(app_key(), text, salt)), expected()), "signature") << salt;
  }
  EXPECT_EQ(refusal(pack(text, sign_pss(app_key(), text, 32, EVP_sha256(), EVP_sha1())), pss), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pss(app_key(), text, 32, EVP_sha512())), pss), "signature");
  EXPECT_EQ(refusal(pack(text, sign_pkcs1(app_key(), text)), pss), "signature");
}

TEST_F(SignStatementTest, EachDigestIsAcceptedWhereItWasAgreedAndNowhereElse) {
  struct row {
    keymaster_digest_t digest;
    const EVP_MD* algorithm;
  };
  const std::vector<row> rows = {{KM_DIGEST_MD5, EVP_md5()},          {KM_DIGEST_SHA1, EVP_sha1()},
                                 {KM_DIGEST_SHA_2_224, EVP_sha224()}, {KM_DIGEST_SHA_2_256, EVP_sha256()},
                                 {KM_DIGEST_SHA_2_384, EVP_sha384()}, {KM_DIGEST_SHA_2_512, EVP_sha512()}};
  const std::string text = good_ + '\0';
  for (const row& agreed : rows) {
    for (const row& used : rows) {
      sign_expectations expectations = expected();
      expectations.scheme.digest = agreed.digest;
      EXPECT_EQ(refusal(pack(text, sign_pkcs1(app_key(), text, used.algorithm)), expectations),
                agreed.digest == used.digest ? "accepted" : "signature");
    }
  }
}

TEST_F(SignStatementTest, ASchemeThatSignsNoDigestIsAMistakeOfTheCaller) {
  const bytes statement = sign_statement(good_, app_key());
  sign_expectations expectations = expected();
  expectations.scheme.digest = KM_DIGEST_NONE;
  EXPECT_THROW((void)verify_sign_statement(statement, expectations), std::invalid_argument);
  expectations.scheme = {.padding = KM_PAD_NONE, .digest = KM_DIGEST_SHA_2_256};
  EXPECT_THROW((void)verify_sign_statement(statement, expectations), std::invalid_argument);
}

TEST_F(SignStatementTest, TheMessageMustBeTheChallenge) {
  for (const char* const raw : {"", "challenge\\/2", "challenge\\/1 ", "Challenge\\/1"}) {
    EXPECT_EQ(refusal_of_text(text_with(raw)), "raw") << raw;
  }
}

TEST_F(SignStatementTest, ControlCharactersStandInTheMessageAsTheyAre) {
  sign_expectations expectations = expected();
  expectations.challenge = "\x01\x0B\x1F\x7F \b\f\n\r\t \"\\/ \u20AC\U0001F600";
  const std::string raw = "\x01\x0B\x1F\x7F \\b\\f\\n\\r\\t \\\"\\\\\\/ \u20AC\U0001F600";
  EXPECT_EQ(refusal(sign_statement(text_with(raw), app_key()), expectations), "accepted");
  const std::string escaped = "\\u0001\x0B\x1F\x7F \\b\\f\\n\\r\\t \\\"\\\\\\/ \u20AC\U0001F600";
  EXPECT_EQ(refusal(sign_statement(text_with(escaped), app_key()), expectations), "form");
}

TEST_F(SignStatementTest, AFingerMustHaveTouchedWhereOneIsAskedFor) {
  const auto refusal_of = [&](const std::string& fid, std::optional<std::vector<std::uint32_t>> fingers) {
    sign_expectations expectations = expected();
    expectations.fingers = std::move(fingers);
    return refusal(sign_statement(text_with("challenge\\/1", fid + "\"counter\":9,\"uid\":1000"), app_key()),
                   expectations);
  };
  using fingers = std::vector<std::uint32_t>;
  EXPECT_EQ(refusal_of("", fingers{5}), "fid");
  EXPECT_EQ(refusal_of("\"fid\":6,", fingers{4, 5}), "fid");
  EXPECT_EQ(refusal_of("\"fid\":4,", fingers{4, 5}), "accepted");
  EXPECT_EQ(refusal_of("", fingers{}), "fid");
  EXPECT_EQ(refusal_of("\"fid\":1,", fingers{}), "accepted");
  EXPECT_EQ(refusal_of("\"fid\":0,", fingers{}), "fid");
  EXPECT_EQ(refusal_of("\"fid\":4294967295,", fingers{}), "fid");
  EXPECT_EQ(refusal_of("", std::nullopt), "accepted");
  EXPECT_EQ(refusal_of("\"fid\":6,", std::nullopt), "accepted");
}

TEST_F(SignStatementTest, ACounterThatHasNotMovedIsRefused) {
  const auto text = [](const char* counter) {
    return text_with("challenge\\/1", "\"fid\":5,\"counter\":" + std::string(counter) + ",\"uid\":1000");
  };
  EXPECT_EQ(refusal_of_text(text("7")), "counter");
  EXPECT_EQ(refusal_of_text(text("6")), "counter");
  EXPECT_EQ(refusal_of_text(text("8")), "accepted");
  EXPECT_EQ(refusal_of_text(text("99999999999")), "accepted");
}

TEST_F(SignStatementTest, AnotherUidThanTheUsersIsRefused) {
  const auto statement = [](const char* uid) {
    return sign_statement(text_with("challenge\\/1", "\"fid\":5,\"counter\":9,\"uid\":" + std::string(uid)), app_key());
  };
  EXPECT_EQ(refusal(statement("1001"), expected()), "uid");
  EXPECT_EQ(refusal(statement("4294967295"), expected()), "uid");
  sign_expectations nobody = expected();
  nobody.uid = std::nullopt;
  EXPECT_EQ(refusal(statement("4294967295"), nobody), "accepted");
  EXPECT_EQ(refusal(statement("1000"), nobody), "uid");
  EXPECT_EQ(refusal(statement("0"), nobody), "uid");
}

TEST_F(SignStatementTest, MembersThatAreMissingOrOutOfTheirPlaceAreRefused) {
  const std::string device = device_members.substr(0, device_members.size() - 1);
  for (const std::string& text : {
           text_with("challenge\\/1", R"("counter":9,"fid":5,"uid":1000)"),
           text_with("challenge\\/1", R"("fid":5,"uid":1000,"counter":9)"),
           text_with("challenge\\/1", R"("fid":5,"counter":9)"),
           text_with("challenge\\/1", R"("fid":5,"uid":1000)"),
           text_with("challenge\\/1", R"("fid":5,"fid":5,"counter":9,"uid":1000)"),
           text_with("challenge\\/1", R"("fid":4294967296,"counter":9,"uid":1000)"),
           text_with("challenge\\/1", R"("fid":"5","counter":9,"uid":1000)"),
           "{\"raw\":\"challenge\\/1\",\"fid\":5,\"counter\":9,\"uid\":1000," + device + ",\"more\":1}",
           "{\"raw\":\"challenge\\/1\",\"fid\":5,\"counter\":9,\"uid\":1000," + device + "," + device + "}",
           std::string("{\"raw\":\"challenge\\/1\",\"fid\":5,\"counter\":9,\"uid\":1000}"),
           "{\"raw\":7,\"fid\":5,\"counter\":9,\"uid\":1000," + device_members,
       }) {
    EXPECT_EQ(refusal_of_text(text), "members") << text;
  }
}

}  // namespace
