// Whether bytes are a text.
#ifndef KEYMASTER_CLIENT_LIB_UTF8_H_
#define KEYMASTER_CLIENT_LIB_UTF8_H_

#include <optional>

#include "client/lib/bytes.h"

namespace keymaster::client {

/// invalid_utf8_at gives the offset of the first byte that begins no well-formed UTF-8 sequence (Unicode, table 3-7: no
/// overlong form, no surrogate, nothing above U+10FFFF), and nothing for a text.
[[nodiscard]] std::optional<std::size_t> invalid_utf8_at(byte_view data);

}  // namespace keymaster::client

#endif  // KEYMASTER_CLIENT_LIB_UTF8_H_
