#include "soter/text.h"

#include <array>

namespace keymaster {
namespace {

/// The sequences that begin with one of a range of lead bytes: how many bytes follow, and what the first of them may
/// be. The others are 80 to BF.
struct sequence_row {
  uint8_t first_lead, last_lead;
  uint8_t following;
  uint8_t lowest_second, highest_second;
};

constexpr std::array<sequence_row, 9> sequences = {{
    {0x00, 0x7F, 0, 0x00, 0x00},
    {0xC2, 0xDF, 1, 0x80, 0xBF},
    {0xE0, 0xE0, 2, 0xA0, 0xBF},
    {0xE1, 0xEC, 2, 0x80, 0xBF},
    {0xED, 0xED, 2, 0x80, 0x9F},
    {0xEE, 0xEF, 2, 0x80, 0xBF},
    {0xF0, 0xF0, 3, 0x90, 0xBF},
    {0xF1, 0xF3, 3, 0x80, 0xBF},
    {0xF4, 0xF4, 3, 0x80, 0x8F},
}};

const sequence_row* row_of(uint8_t lead) {
  for (const sequence_row& row : sequences) {
    if (row.first_lead <= lead && lead <= row.last_lead) return &row;
  }
  return nullptr;
}

bool continues(std::span<const uint8_t> following, const sequence_row& row) {
  if (following.empty()) return true;
  if (following[0] < row.lowest_second || following[0] > row.highest_second) return false;
  for (const uint8_t byte : following.subspan(1)) {
    if ((byte & 0xC0) != 0x80) return false;
  }
  return true;
}

}  // namespace

bool is_utf8(std::span<const uint8_t> bytes) {
  while (!bytes.empty()) {
    const sequence_row* const row = row_of(bytes[0]);
    bytes = bytes.subspan(1);
    if (row == nullptr || row->following > bytes.size()) return false;
    if (!continues(bytes.first(row->following), *row)) return false;
    bytes = bytes.subspan(row->following);
  }
  return true;
}

}  // namespace keymaster
