// What the two programs of the start benchmark agree on: files of length-prefixed blocks.
#ifndef BENCH_FIRST_SIGNATURE_H_
#define BENCH_FIRST_SIGNATURE_H_

#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <vector>

#include "bench/wire.h"

namespace bench {

inline bytes first_message() {
  return bytes(1024, 0x6B);
}

inline void write_blocks(const std::filesystem::path& path, const std::vector<bytes>& blocks) {
  bytes all;
  for (const bytes& block : blocks) append_block(all, block);
  std::ofstream file(path, std::ios::binary);
  file.write(reinterpret_cast<const char*>(all.data()), static_cast<std::streamsize>(all.size()));
  if (!file.flush()) throw std::runtime_error("a file cannot be written");
}

inline std::vector<bytes> read_blocks(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  const bytes all((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  std::vector<bytes> blocks;
  for (std::size_t at = 0; at < all.size();) {
    const std::size_t size = u32_at(all, at);
    const auto from = all.begin() + static_cast<std::ptrdiff_t>(at + 4);
    blocks.emplace_back(from, from + static_cast<std::ptrdiff_t>(size));
    at += 4 + size;
  }
  return blocks;
}

}  // namespace bench

#endif  // BENCH_FIRST_SIGNATURE_H_
