// ECDSA keys on the NIST prime curves: from coordinates, and generated.
#include <openssl/core_names.h>

#include <algorithm>
#include <array>

#include "tee/crypto/key_material.h"
#include "tee/crypto/key_params.h"
#include "tee/crypto/magnitude.h"
#include "tee/crypto/object_types.h"

namespace hosted_tee {

namespace {

struct curve_row {
  std::uint32_t id;
  std::uint32_t bits;
  const char* name;
};
constexpr std::array<curve_row, 5> curves = {{
    {TEE_ECC_CURVE_NIST_P192, 192, "P-192"},
    {TEE_ECC_CURVE_NIST_P224, 224, "P-224"},
    {TEE_ECC_CURVE_NIST_P256, 256, "P-256"},
    {TEE_ECC_CURVE_NIST_P384, 384, "P-384"},
    {TEE_ECC_CURVE_NIST_P521, 521, "P-521"},
}};

const curve_row& curve_of(const attribute_view& given) {
  const std::uint32_t id = given.find(TEE_ATTR_ECC_CURVE)->content.value.a;
  const auto* const found =
      std::find_if(curves.begin(), curves.end(), [&](const curve_row& each) { return each.id == id; });
  refuse_unless(found != curves.end(), TEE_ERROR_BAD_PARAMETERS);
  return *found;
}

/// number_within reads a number that is at most `bits` long.
bytes_view number_within(const attribute_view& given, std::uint32_t attribute, std::uint32_t bits) {
  const bytes_view number = significant(given.bytes(attribute));
  refuse_unless(bit_length(number) <= bits, TEE_ERROR_BAD_PARAMETERS);
  return number;
}

/// uncompressed_point is the point's form in SEC 1, section 2.3.3: 04, X, Y.
secret_bytes uncompressed_point(bytes_view x, bytes_view y, std::size_t field_bytes) {
  secret_bytes point{0x04};
  for (const bytes_view coordinate : {x, y}) {
    const secret_bytes field = right_aligned(coordinate, field_bytes);
    point.insert(point.end(), field.begin(), field.end());
  }
  return point;
}

secret_bytes read_order(const curve_row& curve) {
  const auto group = owned<ec_group>(EC_GROUP_new_by_curve_name(EC_curve_nist2nid(curve.name)));
  const BIGNUM* const order = EC_GROUP_get0_order(group.get());
  secret_bytes number(static_cast<std::size_t>(BN_num_bytes(order)));
  BN_bn2bin(order, number.data());
  return number;
}

/// order_of looks the order of a curve's base point up. libcrypto is asked once: it makes the whole curve anew for the
/// answer.
const secret_bytes& order_of(const curve_row& curve) {
  static const auto* const orders =
      new std::array<secret_bytes, curves.size()>{read_order(curves[0]), read_order(curves[1]), read_order(curves[2]),
                                                  read_order(curves[3]), read_order(curves[4])};
  return orders->at(static_cast<std::size_t>(&curve - curves.data()));
}

/// is_below_order: libcrypto takes any private value, also those with which a signature can't verify.
bool is_below_order(bytes_view number, const curve_row& curve) {
  const secret_bytes& order = order_of(curve);
  if (number.size() > order.size()) return false;
  return right_aligned(number, order.size()) < order;
}

stored_attribute stored_curve(const curve_row& curve) {
  return {.id = TEE_ATTR_ECC_CURVE, .bytes = {}, .a = curve.id};
}

}  // namespace

bool is_curve_size(std::uint32_t bits) {
  return std::any_of(curves.begin(), curves.end(), [&](const curve_row& each) { return each.bits == bits; });
}

key_material ec_from_attributes(const object_type& /*type*/, std::uint32_t max_bits, const attribute_view& given) {
  const curve_row& curve = curve_of(given);
  refuse_unless(curve.bits <= max_bits, TEE_ERROR_BAD_PARAMETERS);
  const bytes_view x = number_within(given, TEE_ATTR_ECC_PUBLIC_VALUE_X, curve.bits);
  const bytes_view y = number_within(given, TEE_ATTR_ECC_PUBLIC_VALUE_Y, curve.bits);

  key_material material;
  material.bits = curve.bits;
  material.attributes.push_back(stored_curve(curve));
  material.attributes.push_back(stored(TEE_ATTR_ECC_PUBLIC_VALUE_X, x));
  material.attributes.push_back(stored(TEE_ATTR_ECC_PUBLIC_VALUE_Y, y));

  key_params params;
  params.add_name(OSSL_PKEY_PARAM_GROUP_NAME, curve.name);
  params.add_octets(OSSL_PKEY_PARAM_PUB_KEY, uncompressed_point(x, y, (curve.bits + 7) / 8));
  if (!given.has(TEE_ATTR_ECC_PRIVATE_VALUE)) {
    material.key = params.build("EC", EVP_PKEY_PUBLIC_KEY);
    return material;
  }
  const bytes_view d = number_within(given, TEE_ATTR_ECC_PRIVATE_VALUE, curve.bits);
  refuse_unless(!d.empty(), TEE_ERROR_BAD_PARAMETERS);
  params.add_number(OSSL_PKEY_PARAM_PRIV_KEY, d);
  material.key = params.build("EC", EVP_PKEY_KEYPAIR);
  refuse_unless(is_below_order(d, curve), TEE_ERROR_BAD_PARAMETERS);
  material.attributes.push_back(stored(TEE_ATTR_ECC_PRIVATE_VALUE, d));
  return material;
}

key_material generate_ec(std::uint32_t bits, const attribute_view& parameters) {
  const curve_row& curve = curve_of(parameters);
  refuse_unless(curve.bits == bits, TEE_ERROR_BAD_PARAMETERS);
  key_material material;
  material.bits = bits;
  material.key.reset(EVP_EC_gen(curve.name));
  refuse_unless(material.key != nullptr, TEE_ERROR_GENERIC);
  material.attributes.push_back(stored_curve(curve));
  constexpr std::array<std::pair<std::uint32_t, const char*>, 3> numbers = {{
      {TEE_ATTR_ECC_PUBLIC_VALUE_X, OSSL_PKEY_PARAM_EC_PUB_X},
      {TEE_ATTR_ECC_PUBLIC_VALUE_Y, OSSL_PKEY_PARAM_EC_PUB_Y},
      {TEE_ATTR_ECC_PRIVATE_VALUE, OSSL_PKEY_PARAM_PRIV_KEY},
  }};
  for (const auto& [attribute, name] : numbers) {
    material.attributes.push_back({.id = attribute, .bytes = number_of(material.key, name)});
  }
  return material;
}

}  // namespace hosted_tee
