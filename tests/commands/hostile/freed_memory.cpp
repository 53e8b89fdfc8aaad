#include "tests/commands/hostile/freed_memory.h"

#include <algorithm>
#include <string_view>
#include <unordered_set>

namespace testing_support {
namespace {

constexpr std::size_t window = 16;

std::string_view text_of(const bytes& data) {
  return {reinterpret_cast<const char*>(data.data()), data.size()};
}

}  // namespace

freed_memory::freed_memory(hosted_tee::secure_world& world) : world_(world) {
  world_.set_free_inspector(
      [this](std::span<const std::uint8_t> block) { blocks_.emplace_back(block.begin(), block.end()); });
}

freed_memory::~freed_memory() {
  world_.set_free_inspector({});
}

bool freed_memory::holds(const bytes& secret) const {
  const std::size_t size = std::min(window, secret.size());
  std::unordered_set<std::string_view> pieces;
  for (std::size_t at = 0; at + size <= secret.size(); ++at) pieces.insert(text_of(secret).substr(at, size));
  return std::any_of(blocks_.begin(), blocks_.end(), [&](const bytes& block) {
    for (std::size_t at = 0; at + size <= block.size(); ++at) {
      if (pieces.contains(text_of(block).substr(at, size))) return true;
    }
    return false;
  });
}

}  // namespace testing_support
