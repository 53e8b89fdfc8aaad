#include "algorithms/ec/ec_signature_der.h"

#include <algorithm>
#include <cstring>

#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint8_t sequence_tag = 0x30;
constexpr uint8_t integer_tag = 0x02;
constexpr uint8_t long_form = 0x80;

std::span<const uint8_t> strip_zeros(std::span<const uint8_t> value) {
  while (!value.empty() && value.front() == 0) value = value.subspan(1);
  return value;
}

/// A leading zero keeps a magnitude with its top bit set from reading as negative.
bool needs_sign_byte(std::span<const uint8_t> value) {
  return !value.empty() && (value.front() & 0x80) != 0;
}

uint32_t content_size(std::span<const uint8_t> value) {
  return static_cast<uint32_t>(value.size()) + (needs_sign_byte(value) ? 1 : 0);
}

/// The size of a length field. It counts one byte up to 127 where encode_length writes one up to 126: such a value
/// cannot be encoded.
uint32_t length_field_size(uint32_t length) {
  const uint32_t bytes = der_length_bytes(length);
  return bytes == 1 && length < 128 ? 1 : bytes + 1;
}

uint32_t element_size(uint32_t content) {
  return 1 + length_field_size(content) + content;
}

void write_integer(uint8_t** position, std::span<const uint8_t> value) {
  *(*position)++ = integer_tag;
  encode_length(position, content_size(value));
  if (needs_sign_byte(value)) *(*position)++ = 0;
  if (!value.empty()) std::memcpy(*position, value.data(), value.size());
  *position += value.size();
}

/// Steps over a tag that was looked at, and reads the length behind it.
bool read_length(const uint8_t** position, const uint8_t* end, uint32_t* length) {
  ++*position;
  if (der_decode_length(position, end, length) == 0) return true;
  TRACE_ERROR("Decode length failed");
  return false;
}

/// Reads tag, length and content of an INTEGER, and drops one sign byte.
bool read_integer(const uint8_t** position, const uint8_t* end, std::span<const uint8_t>& value) {
  if (*position == end) {
    TRACE_ERROR("Decode length failed");
    return false;
  }
  if (**position != integer_tag) {
    TRACE_ERROR("Wrong tag, expect 0x02, got 0x%02x", **position);
    return false;
  }
  uint32_t length = 0;
  if (!read_length(position, end, &length)) return false;
  const uint32_t available = static_cast<uint32_t>(end - *position);
  if (length > available) {
    TRACE_ERROR("Wrong length of integer, %dB available, got %dB", available, length);
    return false;
  }
  value = {*position, length};
  *position += length;
  if (!value.empty() && value.front() == 0) value = value.subspan(1);
  return true;
}

void align_right(std::span<const uint8_t> value, std::span<uint8_t> place) {
  std::fill(place.begin(), place.end(), uint8_t{0});
  std::copy(value.begin(), value.end(), place.end() - static_cast<std::ptrdiff_t>(value.size()));
}

/// Opens the SEQUENCE, which must fill the input.
bool read_sequence(const uint8_t** position, const uint8_t* end) {
  if (end - *position <= 1) {
    TRACE_ERROR("Wrong der length\n");
    return false;
  }
  if (**position != sequence_tag) {
    TRACE_ERROR("Wrong tag, expect 0x30, got 0x%02x", **position);
    return false;
  }
  uint32_t length = 0;
  if (!read_length(position, end, &length)) return false;
  const uint32_t remaining = static_cast<uint32_t>(end - *position);
  if (length != remaining) {
    TRACE_ERROR("Wrong length of sequence, expect %dB, got %dB", remaining, length);
    return false;
  }
  return true;
}

/// Whether the encoder would write just these bytes: one signature must not have two forms.
TEE_Result check_canonical(std::span<const uint8_t> der, std::span<const uint8_t> r, std::span<const uint8_t> s) {
  heap_bytes encoded;
  if (!der_encode_ec_signature(r, s, encoded)) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  if (encoded.size() != der.size()) {
    TRACE_ERROR("Encoding size mismatch");
    return TEE_ERROR_GENERIC;
  }
  if (std::memcmp(encoded.data(), der.data(), der.size()) != 0) {
    TRACE_ERROR("Encoding mismatch");
    return TEE_ERROR_GENERIC;
  }
  return TEE_SUCCESS;
}

}  // namespace

uint32_t der_length_bytes(uint32_t length) {
  if (length < 255) return 1;
  if (length <= 65534) return 2;
  return length <= 16777214 ? 3 : 4;
}

void encode_length(uint8_t** position, uint32_t length) {
  const uint32_t bytes = der_length_bytes(length);
  if (bytes == 1 && length <= 126) {
    *(*position)++ = static_cast<uint8_t>(length);
    return;
  }
  *(*position)++ = static_cast<uint8_t>(long_form | bytes);
  if (bytes < 1 || bytes > sizeof length) {
    TRACE_ERROR("There must be some thing wrong");
    return;
  }
  for (uint32_t i = bytes; i > 0; --i) *(*position)++ = static_cast<uint8_t>(length >> (8 * (i - 1)));
}

int der_decode_length(const uint8_t** position, const uint8_t* end, uint32_t* length) {
  if (*position == end) return 1;
  const uint8_t first = *(*position)++;
  *length = first;
  if (first < long_form) return 0;
  const uint32_t count = first & 0x7F;
  if (count > sizeof *length || count > static_cast<std::size_t>(end - *position)) return 1;
  *length = 0;
  for (uint32_t i = 0; i < count; ++i) *length = (*length << 8) | *(*position)++;
  return 0;
}

bool der_encode_ec_signature(std::span<const uint8_t> r, std::span<const uint8_t> s, heap_bytes& encoded) {
  r = strip_zeros(r);
  s = strip_zeros(s);
  const uint32_t body = element_size(content_size(r)) + element_size(content_size(s));
  const uint32_t total = element_size(body);
  // Each of the three lengths may be written one byte longer than it is counted.
  heap_bytes buffer;
  if (!buffer.allocate(total + 3)) {
    TRACE_ERROR("Out of memory");
    return false;
  }
  uint8_t* position = buffer.data();
  *position++ = sequence_tag;
  encode_length(&position, body);
  write_integer(&position, r);
  write_integer(&position, s);
  if (static_cast<uint32_t>(position - buffer.data()) != total) {
    TRACE_ERROR("Unfilled buffer, size calculation error");
    return false;
  }
  buffer.shorten(total);
  encoded = std::move(buffer);
  return true;
}

TEE_Result der_decode_ec_signature(std::span<const uint8_t> der, std::span<uint8_t> r, std::span<uint8_t> s) {
  const uint8_t* position = der.data();
  const uint8_t* const end = der.data() + der.size();
  std::span<const uint8_t> value;
  if (!read_sequence(&position, end) || !read_integer(&position, end, value)) return TEE_ERROR_GENERIC;
  if (value.size() > r.size()) {
    TRACE_ERROR("Wrong length of R, expect max %dB, got %dB", static_cast<uint32_t>(r.size()),
                static_cast<uint32_t>(value.size()));
    return TEE_ERROR_GENERIC;
  }
  align_right(value, r);
  if (!read_integer(&position, end, value)) return TEE_ERROR_GENERIC;
  if (value.size() > s.size()) {
    TRACE_ERROR("Wrong length of S, expect max %dB, got %dB", static_cast<uint32_t>(s.size()),
                static_cast<uint32_t>(value.size()));
    return TEE_ERROR_GENERIC;
  }
  align_right(value, s);
  return check_canonical(der, r, s);
}

}  // namespace keymaster
