// What the command line becomes: descriptions of keys, parameters of operations, and what is shown of them.
#include <gtest/gtest.h>

#include <CLI/CLI.hpp>

#include "client/kmctl/application.h"
#include "client/kmctl/authorization_options.h"
#include "client/kmctl/command_line.h"
#include "client/kmctl/describe.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/openssl_command.h"

namespace {

using namespace keymaster;
using namespace kmctl;
using client::authorizations;
using client::bytes;

authorizations parse(option_use use, const std::string& line) {
  CLI::App app;
  authorization_options options;
  command_line command(app);
  options.add_to(command, use);
  app.parse(line);
  return options.given();
}

const authorizations rsa_2048 = authorizations{}.algorithm(KM_ALGORITHM_RSA).key_size(2048).rsa_public_exponent(65537);

TEST(KeyOptions, NothingSaidIsASoundSigningKey) {
  EXPECT_EQ(with_defaults({}, option_use::generate), authorizations(rsa_2048)
                                                         .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
                                                         .digest({KM_DIGEST_SHA_2_256})
                                                         .padding({KM_PAD_RSA_PKCS1_1_5_SIGN})
                                                         .no_auth_required());
}

TEST(KeyOptions, WhatIsSaidStandsInPlaceOfTheDefault) {
  const auto all =
      with_defaults(authorizations{}.key_size(4096).digest({KM_DIGEST_SHA1, KM_DIGEST_NONE}), option_use::generate);
  EXPECT_EQ(all.unique_number(KM_TAG_KEY_SIZE), 4096U);
  EXPECT_EQ(all.numbers(KM_TAG_DIGEST), (std::vector<std::uint64_t>{2, 0}));
  EXPECT_EQ(all.count(KM_TAG_ALGORITHM), 1U);
}

TEST(KeyOptions, AnImportedKeyBringsItsOwnSizeAndExponent) {
  const auto all = with_defaults(authorizations{}.algorithm(KM_ALGORITHM_RSA), option_use::import);
  EXPECT_FALSE(all.contains(KM_TAG_KEY_SIZE));
  EXPECT_FALSE(all.contains(KM_TAG_RSA_PUBLIC_EXPONENT));
  EXPECT_TRUE(all.contains(KM_TAG_PADDING));
}

TEST(KeyOptions, RawPaddingGoesWithoutADigest) {
  const auto all = with_defaults(authorizations{}.padding({KM_PAD_NONE}), option_use::generate);
  EXPECT_EQ(all.numbers(KM_TAG_DIGEST), std::vector<std::uint64_t>{KM_DIGEST_NONE});
}

TEST(KeyOptions, AnRsaKeyEncryptsWhenItsPurposesOrItsPaddingsSaySo) {
  const auto encrypts = [](const authorizations& given, std::vector<std::uint64_t> paddings, std::uint64_t digest) {
    const auto all = with_defaults(given, option_use::generate);
    EXPECT_EQ(all.numbers(KM_TAG_PURPOSE), (std::vector<std::uint64_t>{KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}));
    EXPECT_EQ(all.numbers(KM_TAG_PADDING), paddings);
    EXPECT_EQ(all.numbers(KM_TAG_DIGEST), std::vector<std::uint64_t>{digest});
  };
  encrypts(authorizations{}.purpose({KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}), {KM_PAD_RSA_OAEP}, KM_DIGEST_SHA_2_256);
  encrypts(authorizations{}.padding({KM_PAD_RSA_OAEP}), {KM_PAD_RSA_OAEP}, KM_DIGEST_SHA_2_256);
  encrypts(authorizations{}.padding({KM_PAD_RSA_PKCS1_1_5_ENCRYPT}), {KM_PAD_RSA_PKCS1_1_5_ENCRYPT}, KM_DIGEST_NONE);
}

TEST(KeyOptions, AnRsaKeyMayDoBoth) {
  const auto by_purpose =
      with_defaults(authorizations{}.purpose({KM_PURPOSE_SIGN, KM_PURPOSE_DECRYPT}), option_use::generate);
  EXPECT_EQ(by_purpose.numbers(KM_TAG_PADDING),
            (std::vector<std::uint64_t>{KM_PAD_RSA_PKCS1_1_5_SIGN, KM_PAD_RSA_OAEP}));
  const auto by_padding =
      with_defaults(authorizations{}.padding({KM_PAD_RSA_PSS, KM_PAD_RSA_OAEP}), option_use::generate);
  EXPECT_EQ(by_padding.count(KM_TAG_PURPOSE), 4U);
}

TEST(KeyOptions, OtherAlgorithmsHaveDefaultsOfTheirOwn) {
  EXPECT_EQ(with_defaults(authorizations{}.algorithm(KM_ALGORITHM_EC), option_use::generate),
            authorizations{}
                .algorithm(KM_ALGORITHM_EC)
                .key_size(256)
                .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
                .digest({KM_DIGEST_SHA_2_256})
                .no_auth_required());
  EXPECT_EQ(with_defaults(authorizations{}.algorithm(KM_ALGORITHM_AES), option_use::generate),
            authorizations{}
                .algorithm(KM_ALGORITHM_AES)
                .key_size(256)
                .purpose({KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT})
                .block_mode({KM_MODE_GCM})
                .padding({KM_PAD_NONE})
                .min_mac_length(128)
                .no_auth_required());
  const auto hmac = authorizations{}.algorithm(KM_ALGORITHM_HMAC);
  EXPECT_EQ(with_defaults(hmac, option_use::generate).unique_number(KM_TAG_MIN_MAC_LENGTH), 256U);
  EXPECT_EQ(with_defaults(authorizations(hmac).digest({KM_DIGEST_SHA1}), option_use::import)
                .unique_number(KM_TAG_MIN_MAC_LENGTH),
            160U);
}

TEST(KeyOptions, EveryBlockModeGetsAPaddingForTextsOfAnyLength) {
  struct row {
    std::vector<keymaster_block_mode_t> modes;
    std::vector<std::uint64_t> paddings;
    bool has_tag;
  };
  for (const auto& [modes, paddings, has_tag] : std::vector<row>{
           {{KM_MODE_CBC}, {KM_PAD_PKCS7}, false},
           {{KM_MODE_ECB}, {KM_PAD_PKCS7}, false},
           {{KM_MODE_CTR}, {KM_PAD_NONE}, false},
           {{KM_MODE_CBC, KM_MODE_GCM}, {KM_PAD_NONE, KM_PAD_PKCS7}, true},
       }) {
    auto given = authorizations{}.algorithm(KM_ALGORITHM_AES);
    for (const auto mode : modes) {
      given.block_mode({mode});
    }
    const auto all = with_defaults(given, option_use::generate);
    EXPECT_EQ(all.count(KM_TAG_BLOCK_MODE), modes.size());
    EXPECT_EQ(all.numbers(KM_TAG_PADDING), paddings);
    EXPECT_EQ(all.contains(KM_TAG_MIN_MAC_LENGTH), has_tag);
  }
}

TEST(KeyOptions, AKeyWithAUserNeedsAuthentication) {
  EXPECT_FALSE(
      with_defaults(authorizations{}.user_secure_id(1), option_use::generate).contains(KM_TAG_NO_AUTH_REQUIRED));
}

TEST(KeyOptions, EveryOptionBecomesItsTag) {
  EXPECT_EQ(
      parse(option_use::generate,
            "--algorithm rsa --size 2048 --exponent 0x10001 --purpose sign,verify --digest sha-256,none --padding pss "
            "--block-mode gcm --caller-nonce --min-mac-length 96 --active 2030-01-01 --origination-expire 2031-01-01 "
            "--usage-expire 2032-01-01 --max-uses-per-boot 3 --min-seconds-between-ops 4 --bootloader-only "
            "--no-auth-required --user-secure-id 5,6 --user-auth-type fingerprint --auth-timeout 7"),
      authorizations(rsa_2048)
          .purpose({KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY})
          .digest({KM_DIGEST_SHA_2_256, KM_DIGEST_NONE})
          .padding({KM_PAD_RSA_PSS})
          .block_mode({KM_MODE_GCM})
          .caller_nonce()
          .min_mac_length(96)
          .add(KM_TAG_ACTIVE_DATETIME, std::uint64_t{1893456000000})
          .add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, std::uint64_t{1924992000000})
          .add(KM_TAG_USAGE_EXPIRE_DATETIME, std::uint64_t{1956528000000})
          .max_uses_per_boot(3)
          .min_seconds_between_ops(4)
          .add(KM_TAG_BOOTLOADER_ONLY, std::uint64_t{1})
          .no_auth_required()
          .user_secure_id(5)
          .user_secure_id(6)
          .user_auth_type(2)
          .auth_timeout(7));
}

TEST(KeyOptions, AListMayBeGivenInPieces) {
  EXPECT_EQ(parse(option_use::generate, "--digest sha-1,sha-256 --digest none").numbers(KM_TAG_DIGEST),
            (std::vector<std::uint64_t>{KM_DIGEST_SHA1, KM_DIGEST_SHA_2_256, KM_DIGEST_NONE}));
}

TEST(CipherOptions, EveryOptionBecomesItsTag) {
  EXPECT_EQ(parse(option_use::cipher, "--block-mode cbc --padding pkcs7 --digest sha-1 --mac-length 96"),
            authorizations{}.block_mode({KM_MODE_CBC}).padding({KM_PAD_PKCS7}).digest({KM_DIGEST_SHA1}).mac_length(96));
}

TEST(KeyOptions, ValuesThatDontFitAreRefused) {
  EXPECT_THROW(parse(option_use::generate, "--digest sha-1,sha-3"), usage_error);
  EXPECT_THROW(parse(option_use::generate, "--size 1024 --size 2048"), CLI::ParseError);
  EXPECT_THROW(parse(option_use::generate, "--digest sha-3"), usage_error);
  EXPECT_THROW(parse(option_use::generate, "--size 4294967296"), usage_error);
  EXPECT_THROW(parse(option_use::generate, "--active yesterday"), usage_error);
  EXPECT_THROW(parse(option_use::generate, "--mac-length 96"), CLI::ParseError);
  EXPECT_THROW(parse(option_use::operation, "--purpose sign"), CLI::ParseError);
  EXPECT_THROW(parse(option_use::operation, "--block-mode gcm"), CLI::ParseError);
}

TEST(Describe, GroupsRepeatedTagsAndNamesValues) {
  const auto list = authorizations(rsa_2048)
                        .purpose({KM_PURPOSE_SIGN})
                        .digest({KM_DIGEST_NONE, KM_DIGEST_SHA_2_256})
                        .no_auth_required()
                        .add(KM_TAG_ACTIVE_DATETIME, std::uint64_t{1893456000000})
                        .application_id(bytes{0xAB, 0x01})
                        .add(0x30001234, std::uint64_t{9});
  EXPECT_EQ(describe_text(list),
            "  algorithm                   rsa\n"
            "  key-size                    2048\n"
            "  rsa-public-exponent         65537\n"
            "  purpose                     sign\n"
            "  digest                      none, sha-256\n"
            "  no-auth-required            yes\n"
            "  active-datetime             2030-01-01T00:00:00Z\n"
            "  application-id              ab01\n"
            "  tag-0x30001234              9");
  EXPECT_EQ(describe_json(list), json::parse(R"({
    "algorithm": "rsa", "key_size": 2048, "rsa_public_exponent": 65537, "purpose": ["sign"],
    "digest": ["none", "sha-256"], "no_auth_required": true, "active_datetime": "2030-01-01T00:00:00Z",
    "application_id": "ab01", "tag_0x30001234": 9})"));
  EXPECT_EQ(key_title(list), "RSA-2048");
  EXPECT_EQ(key_title({}), "UNKNOWN");
}

TEST(Describe, OfAnotherKeysBlobOnlyTheSizeIsShown) {
  const auto list = authorizations{}
                        .soter_key()
                        .soter_signed_by_key()
                        .soter_signing_key_blob(bytes(1234, 0xB1))
                        .soter_signing_key_name(bytes(5, 0xB2))
                        .soter_counted()
                        .soter_uid(4294967295)
                        .soter_signed_by_attk();
  EXPECT_EQ(describe_text(list),
            "  soter-key                   yes\n"
            "  soter-signed-by-key         yes\n"
            "  soter-signing-key-blob      1,234 bytes\n"
            "  soter-signing-key-name      5 bytes\n"
            "  soter-counted               yes\n"
            "  soter-uid                   4294967295\n"
            "  soter-signed-by-attk        yes");
  EXPECT_EQ(describe_json(list), json::parse(R"({
    "soter_key": true, "soter_signed_by_key": true, "soter_signing_key_blob": {"size": 1234},
    "soter_signing_key_name": {"size": 5}, "soter_counted": true, "soter_uid": 4294967295,
    "soter_signed_by_attk": true})"));
}

/// The sub-commands, without the groups of options, which have no names.
std::vector<const CLI::App*> commands_of(const CLI::App& app) {
  return app.get_subcommands([](const CLI::App* command) { return !command->get_name().empty(); });
}

/// Every command has a description, and at the end of each path through the groups stand examples.
std::size_t expect_teaching(const CLI::App& group, const std::string& path) {
  std::size_t found = 0;
  for (const CLI::App* const command : commands_of(group)) {
    const std::string name = path + " " + command->get_name();
    EXPECT_FALSE(command->get_description().empty()) << name;
    if (!commands_of(*command).empty()) {
      found += expect_teaching(*command, name);
      continue;
    }
    EXPECT_NE(command->get_footer().find(name), std::string::npos) << name;
    ++found;
  }
  return found;
}

TEST(CommandLine, EverySubCommandTeaches) {
  context ctx;
  const auto app = make_application(ctx);
  EXPECT_GE(expect_teaching(*app, "kmctl"), 23U);
  for (const char* const code : {"  0  ", "  1  ", "  2  ", "  3  ", "  4  ", "  5  ", "  6  "}) {
    EXPECT_NE(app->help().find(code), std::string::npos) << code;
  }
}

TEST(OpensslCommand, IsPrintedAsAShellTakesIt) {
  EXPECT_EQ(shell_words({"openssl", "a b", "it's", "", "x=/y"}), "openssl 'a b' 'it'\\''s' '' x=/y");
  EXPECT_EQ(verify_command("p.pem", "s", "-f").back(), "./-f");
  EXPECT_EQ(shell_words(mac_command("00ff", "-f")), "openssl dgst -sha256 -mac HMAC -macopt hexkey:00ff ./-f");
}

TEST(OpensslCommand, GivesStatusAndOutput) {
  const auto done = run_command({"sh", "-c", "echo out; echo err >&2; exit 7"});
  EXPECT_EQ(done.status, 7);
  EXPECT_EQ(done.output, "out\nerr\n");
  EXPECT_EQ(run_command({"sh", "-c", "kill -9 $$"}).status, 128 + 9);
  EXPECT_THROW((void)run_command({"/does/not/exist"}), failure_error);
  EXPECT_THROW((void)run_command({"sh", "-c", "exit 127"}), failure_error) << "the same, told in another way";
}

}  // namespace
