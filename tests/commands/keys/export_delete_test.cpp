// export_key, delete_key and delete_all_key.
#include <openssl/x509.h>

#include <cstdlib>
#include <fstream>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

class ExportTest : public CommandTest {};

TEST_F(ExportTest, AnImportedKeysPublicHalfIsWhatLibcryptoEncodes) {
  for (const unsigned bits : {512U, 680U, 1024U, 2048U}) {
    const bytes blob = import_fixed(bits);
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().export_key(blob); });
    expect_same(before);
    EXPECT_EQ(to_hex(a.body()), to_hex(rsa_test_key::of_bits(bits).spki()));
    EXPECT_TRUE(tee.traced("normal export_key\n", hosted_tee::trace_level::debug));
  }
}

TEST_F(ExportTest, AGeneratedKeysPublicHalfVerifiesItsSignatures) {
  const bytes blob = client().must_generate(rsa_key(1024));
  const bytes der = client().export_key(blob).body();
  const std::uint8_t* in = der.data();
  const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> key(d2i_PUBKEY(nullptr, &in, static_cast<long>(der.size())),
                                                                EVP_PKEY_free);
  ASSERT_NE(key, nullptr);
  EXPECT_EQ(in, der.data() + der.size());
  EXPECT_EQ(EVP_PKEY_get_bits(key.get()), 1024);

  const bytes message = from_text("signed inside, verified outside");
  const finish_answer made = client().sign(blob, signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN), message);
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  ASSERT_EQ(EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, key.get()), 1);
  EXPECT_EQ(EVP_DigestVerify(context.get(), made.data.data(), made.data.size(), message.data(), message.size()), 1);
}

TEST_F(ExportTest, TheOpensslCommandReadsIt) {
  const bytes der = client().export_key(client().must_generate(rsa_key(1024))).body();
  const std::string file = (tee.folder() / "public.der").string();
  std::ofstream(file, std::ios::binary)
      .write(reinterpret_cast<const char*>(der.data()), static_cast<std::streamsize>(der.size()));
  const std::string command = "openssl pkey -pubin -inform DER -in '" + file + "' -outform DER -out '" + file + "2'";
  ASSERT_EQ(std::system(command.c_str()), 0);  // NOLINT(concurrency-mt-unsafe): one thread
  std::ifstream again(file + "2", std::ios::binary);
  EXPECT_EQ(bytes(std::istreambuf_iterator<char>(again), {}), der);
}

TEST_F(ExportTest, ATooSmallBufferIsAnUnknownError) {
  const bytes blob = import_fixed(1024);
  const std::size_t size = rsa_test_key::of_bits(1024).spki().size();
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{1}, size - 1}) {
    expect_failure(refused(KM_ERROR_UNKNOWN_ERROR, {"TEE_AsymmetricExport failed: ffff0010\n", "Export key failed"}),
                   [&] { return client().export_key(blob, {}, {}, capacity); });
  }
  EXPECT_EQ(succeeds([&] { return client().export_key(blob, {}, {}, size); }).size, size);
}

TEST_F(ExportTest, ARequestThatEndsInsideAFieldIsRefused) {
  const bytes whole = key_body(import_fixed(512), from_text("app"), from_text("data"));
  for (const std::size_t size : {std::size_t{0}, std::size_t{3}, std::size_t{4}, whole.size() - 9, whole.size() - 1}) {
    const bytes cut(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size));
    expect_failure(broken(TEEC_ERROR_GENERIC, {"Too short input"}),
                   [&] { return client().call(KM_COMMAND_EXPORT_KEY, 0, 0, cut, std::size_t{512}); });
  }
}

TEST_F(ExportTest, EachPlatformFailureHasItsLineAndIsAnUnknownError) {
  struct platform_failure {
    const char* call;
    std::uint32_t n;  // of the command's calls of that function
    std::string line;
  };
  const bytes blob = import_fixed(512);
  for (const platform_failure& each :
       {platform_failure{"TEE_AllocateOperation", 3, "TEE_AllocateOperation failed: ffff000c\n"},
        {"TEE_SetOperationKey", 3, "TEE_SetOperationKey failed: ffff000c\n"},
        {"TEE_AsymmetricExport", 1, "TEE_AsymmetricExport failed: ffff000c\n"}}) {
    tee.world().faults().fail_call(each.call, each.n, TEE_ERROR_OUT_OF_MEMORY);
    expect_failure(refused(KM_ERROR_UNKNOWN_ERROR, {each.line, "Export key failed"}),
                   [&] { return client().export_key(blob); });
  }
  for (const platform_failure& each :
       {platform_failure{"TEE_AllocateTransientObject", 2, "AllocateTransientObject failed with 0xffff000c\n"},
        {"TEE_PopulateTransientObject", 2, "PopulateTransientObject failed with 0xffff000c\n"}}) {
    tee.world().faults().fail_call(each.call, each.n, TEE_ERROR_OUT_OF_MEMORY);
    expect_failure(
        refused(KM_ERROR_UNKNOWN_ERROR, {each.line, "resolve key from data stream error\n", "Export key failed"}),
        [&] { return client().export_key(blob); });
  }
}

class DeleteTest : public CommandTest {
 protected:
  answer delete_raw(const bytes& body) { return client().call(KM_COMMAND_DELETE_KEY, 0, 0, body, std::nullopt); }
};

TEST_F(DeleteTest, NothingIsErased) {
  const bytes blob = import_fixed(512);
  const hosted_tee::accounting before = tee.accounting();
  (void)succeeds([&] { return client().delete_key(blob); });
  (void)succeeds([&] { return client().delete_key(blob); });
  (void)succeeds([&] { return client().delete_all(); });
  expect_same(before);
  EXPECT_TRUE(client().characteristics(blob).ok());
}

TEST_F(DeleteTest, GarbageOfTwoBytesIsDeletedToo) {
  for (const std::size_t size : {2U, 92U, 5000U}) (void)succeeds([&] { return client().delete_key(pattern(size)); });
  (void)succeeds([&] { return delete_raw(join({prefixed(bytes(2)), from_text("ignored")})); });
}

TEST_F(DeleteTest, WhatCantBeABlobIsRefused) {
  for (const std::size_t size : {0U, 1U}) {
    expect_failure(refused(KM_ERROR_INVALID_KEY_BLOB, {"Keystore delete key failed"}),
                   [&] { return client().delete_key(bytes(size)); });
  }
}

TEST_F(DeleteTest, ABlobThatRunsPastTheRequestIsRefused) {
  for (const bytes& body : {bytes{}, bytes(3), u32(1), join({u32(0xFFFFFFFF), bytes(9)})}) {
    expect_failure(broken(TEEC_ERROR_GENERIC, {"Too short input"}), [&] { return delete_raw(body); });
  }
}

TEST_F(DeleteTest, OperationsGoOnWhenAllKeysAreDeleted) {
  const bytes blob = import_fixed(512);
  const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_NONE, KM_PAD_NONE));
  EXPECT_TRUE(client().delete_all().ok());
  EXPECT_TRUE(client().finish(handle).ok());
}

}  // namespace
}  // namespace testing_support
