#include "client/lib/capabilities.h"

#include <array>
#include <optional>

#include "client/lib/wire.h"
#include "src/params/keymaster_defs.h"

namespace keymaster::client {
namespace {

/// No table of the TA is nearly as long; a longer count is not an answer of it.
constexpr std::uint32_t longest_table = 1024;

struct list_commands {
  keymaster_command_t count;
  keymaster_command_t list;
};
constexpr list_commands block_modes{KM_COMMAND_GET_SUPPORT_BLK_MODE_CNT, KM_COMMAND_GET_SUPPORT_BLK_MODE};
constexpr list_commands paddings{KM_COMMAND_GET_SUPPORT_PADDING_MODE_CNT, KM_COMMAND_GET_SUPPORT_PADDING_MODE};
constexpr list_commands digests{KM_COMMAND_GET_SUPPORT_DIGEST_CNT, KM_COMMAND_GET_SUPPORT_DIGEST};
constexpr list_commands imports{KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT_CNT, KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT};
constexpr list_commands exports{KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT_CNT, KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT};

std::vector<std::uint32_t> words(byte_view body) {
  byte_reader in{body};
  std::vector<std::uint32_t> out;
  while (in.remaining() != 0) {
    out.push_back(in.read_u32());
  }
  return out;
}

std::size_t table_bytes(std::uint32_t count) {
  if (count > longest_table) {
    throw format_error("the TA announces a table of " + std::to_string(count) + " entries");
  }
  return std::size_t{count} * 4;
}

/// The TA insists on a buffer of exactly the announced size, so the count comes first.
std::vector<std::uint32_t> read_list(session& ta, list_commands which, std::uint32_t algorithm, std::uint32_t purpose) {
  const reply count = ta.call({.command = which.count, .a = algorithm, .b = purpose});
  if (count.b == 0) {
    return {};
  }
  const std::size_t capacity = table_bytes(count.b);
  return words(ta.call({.command = which.list, .a = algorithm, .b = purpose, .response_capacity = capacity}).body);
}

/// The TA refuses the formats of an algorithm that it knows and does not serve: there are none.
std::vector<std::uint32_t> read_formats(session& ta, list_commands which, std::uint32_t algorithm) {
  try {
    return read_list(ta, which, algorithm, 0);
  } catch (const error& refused) {
    if (refused.kind() == error_kind::keymaster && refused.facts().keymaster_error == KM_ERROR_UNSUPPORTED_ALGORITHM) {
      return {};
    }
    throw;
  }
}

/// Nothing for a purpose that the algorithm does not serve.
std::optional<purpose_capabilities> read_purpose(session& ta, std::uint32_t algorithm, std::uint32_t purpose) {
  try {
    return purpose_capabilities{.purpose = purpose,
                                .block_modes = read_list(ta, block_modes, algorithm, purpose),
                                .paddings = read_list(ta, paddings, algorithm, purpose),
                                .digests = read_list(ta, digests, algorithm, purpose)};
  } catch (const error& refused) {
    if (refused.kind() == error_kind::keymaster && refused.facts().keymaster_error == KM_ERROR_UNSUPPORTED_PURPOSE) {
      return std::nullopt;
    }
    throw;
  }
}

}  // namespace

std::vector<algorithm_capabilities> get_capabilities(session& ta) {
  const reply count = ta.call_plain({.command = KM_COMMAND_GET_SUPPORT_ALGO_CNT});
  const std::size_t capacity = table_bytes(count.a);
  const reply list = ta.call_plain({.command = KM_COMMAND_GET_SUPPORT_ALGO, .response_capacity = capacity});

  std::vector<algorithm_capabilities> all;
  for (const std::uint32_t algorithm : words(list.body)) {
    algorithm_capabilities one{.algorithm = algorithm,
                               .purposes = {},
                               .import_formats = read_formats(ta, imports, algorithm),
                               .export_formats = read_formats(ta, exports, algorithm)};
    for (const std::uint32_t purpose :
         std::array<std::uint32_t, 4>{KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT, KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      if (auto served = read_purpose(ta, algorithm, purpose)) {
        one.purposes.push_back(std::move(*served));
      }
    }
    all.push_back(std::move(one));
  }
  return all;
}

}  // namespace keymaster::client
