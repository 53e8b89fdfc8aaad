#include "tee/crypto/ecdsa_operation.h"

#include "tee/crypto/magnitude.h"

namespace hosted_tee {

namespace {

/// der_of gives the DER form in which libcrypto takes the signature.
secret_bytes der_of(bytes_view r, bytes_view s) {
  const auto parsed = owned<ecdsa_signature>(ECDSA_SIG_new());
  auto first = owned<bignum>(BN_bin2bn(r.data(), static_cast<int>(r.size()), nullptr));
  auto second = owned<bignum>(BN_bin2bn(s.data(), static_cast<int>(s.size()), nullptr));
  ECDSA_SIG_set0(parsed.get(), first.release(), second.release());
  secret_bytes der(static_cast<std::size_t>(i2d_ECDSA_SIG(parsed.get(), nullptr)));
  unsigned char* position = der.data();
  i2d_ECDSA_SIG(parsed.get(), &position);
  return der;
}

}  // namespace

secret_bytes ecdsa_operation::digest_for_libcrypto(bytes_view digest) const {
  refuse_unless(digest.size() <= half_bytes(), TEE_ERROR_BAD_PARAMETERS);
  secret_bytes bytes(digest.begin(), digest.end());
  const auto surplus = static_cast<unsigned>(half_bytes() * 8 - kind().exact_bits);
  if (digest.size() < half_bytes() || surplus == 0) return bytes;
  refuse_unless(bit_length(significant(digest)) <= kind().exact_bits, TEE_ERROR_BAD_PARAMETERS);
  // libcrypto keeps the leftmost bits of a digest that has more than the order, so they go to the left.
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    const unsigned next = i + 1 < bytes.size() ? bytes[i + 1] : 0U;
    bytes[i] = static_cast<std::uint8_t>((unsigned{bytes[i]} << surplus) | (next >> (8 - surplus)));
  }
  return bytes;
}

void ecdsa_operation::sign(const attribute_view& /*params*/, bytes_view digest, const output& signature) const {
  expect_mode(TEE_MODE_SIGN);
  expect_key();
  const secret_bytes integer = digest_for_libcrypto(digest);
  const std::size_t half = half_bytes();
  std::uint8_t* const place = signature.room(2 * half);

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_sign_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  secret_bytes der(static_cast<std::size_t>(EVP_PKEY_get_size(key().get())));
  std::size_t written = der.size();
  refuse_unless(EVP_PKEY_sign(libcrypto.get(), der.data(), &written, pointer_to(integer), integer.size()) == 1,
                TEE_ERROR_BAD_PARAMETERS);
  const unsigned char* position = der.data();
  const ecdsa_signature parsed(d2i_ECDSA_SIG(nullptr, &position, static_cast<long>(written)));
  refuse_unless(parsed != nullptr, TEE_ERROR_GENERIC);
  const auto width = static_cast<int>(half);
  refuse_unless(BN_bn2binpad(ECDSA_SIG_get0_r(parsed.get()), place, width) == width &&
                    BN_bn2binpad(ECDSA_SIG_get0_s(parsed.get()), place + half, width) == width,
                TEE_ERROR_GENERIC);
  signature.written(2 * half);
}

void ecdsa_operation::verify(const attribute_view& /*params*/, bytes_view digest, bytes_view signature) const {
  expect_mode(TEE_MODE_VERIFY);
  expect_key();
  const secret_bytes integer = digest_for_libcrypto(digest);
  const std::size_t half = half_bytes();
  refuse_unless(signature.size() == 2 * half, TEE_ERROR_SIGNATURE_INVALID);
  const secret_bytes der = der_of(signature.first(half), signature.last(half));

  const evp_key_context libcrypto = context();
  refuse_unless(EVP_PKEY_verify_init(libcrypto.get()) == 1, TEE_ERROR_GENERIC);
  refuse_unless(EVP_PKEY_verify(libcrypto.get(), der.data(), der.size(), pointer_to(integer), integer.size()) == 1,
                TEE_ERROR_SIGNATURE_INVALID);
}

}  // namespace hosted_tee
