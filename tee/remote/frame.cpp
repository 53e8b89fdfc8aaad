#include "tee/remote/frame.h"

#include <algorithm>

namespace hosted_tee::remote {
namespace {

constexpr std::size_t length_offset = 8;

}  // namespace

bool read_frame(std::span<const std::uint8_t> packet, frame& out) {
  frame_reader in(packet);
  std::span<const std::uint8_t> family;
  frame_header header;
  std::uint32_t length = 0;
  if (!in.bytes(magic.size(), family) || !std::equal(magic.begin(), magic.end(), family.begin())) return false;
  if (!in.number(header.version) || !in.number(header.kind) || !in.number(length) || !in.number(header.sequence)) {
    return false;
  }
  if (length != packet.size() - header_size) return false;
  out = {header, packet.subspan(header_size)};
  return true;
}

frame_builder::frame_builder(std::span<std::uint8_t> room, std::uint16_t kind, std::uint32_t sequence)
    : room_(room), writer_(room) {
  writer_.bytes(magic);
  writer_.number(wire_version);
  writer_.number(kind);
  writer_.number(std::uint32_t{0});  // the length, which is known at the end
  writer_.number(sequence);
}

std::span<const std::uint8_t> frame_builder::finish() {
  if (!writer_.ok()) return {};
  frame_writer length(room_.subspan(length_offset));
  length.number(static_cast<std::uint32_t>(writer_.size() - header_size));
  return room_.first(writer_.size());
}

}  // namespace hosted_tee::remote
