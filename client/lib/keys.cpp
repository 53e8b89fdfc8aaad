#include "client/lib/keys.h"

#include <algorithm>

#include "client/lib/wire.h"

namespace keymaster::client {
namespace {

/// What a sealed blob needs beside key data and characteristics: protection type, nonce, IV, tag and two lengths.
constexpr std::size_t seal_overhead = 101;

/// The TA adds at most three values to a description: origin, size and public exponent.
constexpr std::size_t added_by_the_ta = std::size_t{3} * 24;

/// Above every size that the TA makes; a description that asks for more is refused there.
constexpr std::uint64_t largest_key_bits = 16384;

/// The public part of the largest key (RSA-8192) has 1,062 bytes.
constexpr std::size_t export_capacity = 8192;

/// The key data of a key of so many bits. RSA needs the most: modulus and private exponent of full length, five
/// components of half length, the public exponent, and nine words.
constexpr std::size_t key_data_limit(std::uint64_t bits) {
  const auto full = static_cast<std::size_t>(bits / 8 + 1);
  return 2 * full + 5 * (full / 2 + 1) + 8 + std::size_t{9} * 4;
}

bytes blob_and_application(byte_view blob, const application& app) {
  bytes request;
  append_block(request, blob);
  append_block(request, app.id);
  append_block(request, app.data);
  return request;
}

}  // namespace

authorizations application::tags() const {
  authorizations list;
  if (!id.empty()) {
    list.application_id(id);
  }
  if (!data.empty()) {
    list.application_data(data);
  }
  return list;
}

std::size_t sealed_size_limit(const authorizations& description, std::size_t material_size) {
  const std::uint64_t bits = description.unique_number(KM_TAG_KEY_SIZE).value_or(largest_key_bits);
  const std::size_t made = key_data_limit(std::min(bits, largest_key_bits));
  const std::size_t imported = material_size + 8;  // in front of raw material stand a size and an object type
  return seal_overhead + std::max(made, imported) + description.marshalled_size() + added_by_the_ta;
}

key_blob generate_key(session& ta, const authorizations& description) {
  const bytes request = description.marshal();
  return ta
      .call(
          {.command = KM_COMMAND_GENERATE_KEY, .request = request, .response_capacity = sealed_size_limit(description)})
      .body;
}

imported_key import_key(session& ta, const authorizations& description, byte_view material) {
  secret_bytes request;
  const bytes marshalled = description.marshal();
  request.reserve(4 + marshalled.size() + material.size());
  append_block(request, marshalled);
  append_bytes(request, material);

  const std::size_t characteristics = 4 + description.marshalled_size() + added_by_the_ta;
  const reply answer =
      ta.call({.command = KM_COMMAND_IMPORT_KEY,
               .request = request,
               .response_capacity = 4 + sealed_size_limit(description, material.size()) + characteristics});
  byte_reader in{answer.body};
  const byte_view blob = in.read_block();
  return {.blob = {blob.begin(), blob.end()}, .characteristics = authorizations::unmarshal(in.read_block())};
}

authorizations get_characteristics(session& ta, byte_view blob, const application& app) {
  const bytes request = blob_and_application(blob, app);
  const reply size = ta.call({.command = KM_COMMAND_GET_KEY_CHARACTER_SIZE, .request = request});
  const reply answer =
      ta.call({.command = KM_COMMAND_GET_KEY_CHARACTER, .request = request, .response_capacity = std::size_t{size.b}});
  return authorizations::unmarshal(answer.body);
}

bytes export_key(session& ta, byte_view blob, const application& app) {
  const bytes request = blob_and_application(blob, app);
  return ta.call({.command = KM_COMMAND_EXPORT_KEY, .request = request, .response_capacity = export_capacity}).body;
}

void delete_key(session& ta, byte_view blob) {
  bytes request;
  append_block(request, blob);
  ta.call({.command = KM_COMMAND_DELETE_KEY, .request = request});
}

void delete_all_keys(session& ta) {
  ta.call({.command = KM_COMMAND_DELETE_ALL_KEY});
}

}  // namespace keymaster::client
