// What the TA offers: its algorithms, and what each one takes for each purpose.
#ifndef KEYMASTER_CLIENT_LIB_CAPABILITIES_H_
#define KEYMASTER_CLIENT_LIB_CAPABILITIES_H_

#include <cstdint>
#include <vector>

#include "client/lib/session.h"

namespace keymaster::client {

struct purpose_capabilities {
  std::uint32_t purpose;
  std::vector<std::uint32_t> block_modes;
  std::vector<std::uint32_t> paddings;
  std::vector<std::uint32_t> digests;
};

struct algorithm_capabilities {
  std::uint32_t algorithm;
  std::vector<purpose_capabilities> purposes;  ///< only those that the algorithm serves
  std::vector<std::uint32_t> import_formats;
  std::vector<std::uint32_t> export_formats;
};

/// get_capabilities asks the TA for its tables (commands 1 to 12), in its own order. Throws error, or format_error when
/// an answer is malformed.
[[nodiscard]] std::vector<algorithm_capabilities> get_capabilities(session& ta);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_CAPABILITIES_H_
