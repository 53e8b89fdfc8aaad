#include "tee/server/shared_memory.h"

namespace hosted_tee {
namespace {

constexpr std::uint32_t known_flags = TEEC_MEM_INPUT | TEEC_MEM_OUTPUT;

bool has_room(std::uint64_t taken, std::uint64_t more, std::uint64_t limit) {
  return taken <= limit && more <= limit - taken;
}

// Users and processes come and go; those without memory leave no entry.
template <class Map>
void drop_if_empty(Map& map, typename Map::iterator entry) {
  if (entry->second == 0) map.erase(entry);
}

}  // namespace

bool memory_account::add(const memory_holder& holder, std::uint64_t bytes, const server_limits& limits) {
  const std::scoped_lock lock(mutex_);
  const auto of_user = of_users_.try_emplace(holder.user).first;
  const auto of_process = of_processes_.try_emplace({holder.user, holder.process}).first;
  if (!has_room(bytes_, bytes, limits.memory_of_all) || !has_room(of_user->second, bytes, limits.memory_per_user) ||
      !has_room(of_process->second, bytes, limits.memory_per_process)) {
    drop_if_empty(of_users_, of_user);
    drop_if_empty(of_processes_, of_process);
    return false;
  }
  of_user->second += bytes;
  of_process->second += bytes;
  bytes_ += bytes;
  ++blocks_;
  return true;
}

void memory_account::remove(const memory_holder& holder, std::uint64_t bytes) noexcept {
  const std::scoped_lock lock(mutex_);
  const auto of_user = of_users_.find(holder.user);
  const auto of_process = of_processes_.find({holder.user, holder.process});
  of_user->second -= bytes;
  of_process->second -= bytes;
  drop_if_empty(of_users_, of_user);
  drop_if_empty(of_processes_, of_process);
  bytes_ -= bytes;
  --blocks_;
}

std::optional<memory_place> memory_place::take(memory_account& account, const memory_holder& holder,
                                               std::uint64_t bytes, const server_limits& limits) {
  if (!account.add(holder, bytes, limits)) return std::nullopt;
  return memory_place(account, holder, bytes);
}

memory_place::~memory_place() {
  if (account_ != nullptr) account_->remove(holder_, bytes_);
}

std::uint64_t block_collection::bytes() const {
  std::uint64_t sum = 0;
  for (const auto& [number, held] : blocks_) sum += held.memory.bytes().size();
  return sum;
}

TEEC_Result block_collection::add(int file, std::uint32_t size, std::uint32_t flags, std::uint32_t& number) {
  if (size == 0 || size > TEEC_CONFIG_SHAREDMEM_MAX_SIZE || flags == 0 || (flags & ~known_flags) != 0) {
    return TEEC_ERROR_BAD_PARAMETERS;
  }
  if (file < 0) return TEEC_ERROR_OUT_OF_MEMORY;
  if (!is_safe_to_share(file, size)) return TEEC_ERROR_BAD_PARAMETERS;
  if (blocks_.size() >= limits_.blocks || size > limits_.memory - bytes()) return TEEC_ERROR_OUT_OF_MEMORY;
  auto place = memory_place::take(account_, holder_, size, limits_);
  auto memory = place ? map_file(file, size) : std::nullopt;
  if (!memory) return TEEC_ERROR_OUT_OF_MEMORY;
  do {
    ++last_number_;
  } while (last_number_ == 0 || blocks_.contains(last_number_));
  number = last_number_;
  blocks_.emplace(number, block{std::move(*place), std::move(*memory), flags});
  return TEEC_SUCCESS;
}

bool block_collection::remove(std::uint32_t number) {
  const auto found = blocks_.find(number);
  if (found == blocks_.end()) return false;
  found->second.memory.empty_file();
  blocks_.erase(found);
  return true;
}

void block_collection::remove_all() {
  for (const auto& [number, held] : blocks_) held.memory.empty_file();
  blocks_.clear();
}

std::optional<std::span<std::uint8_t>> block_collection::part(std::uint32_t number, std::uint32_t offset,
                                                              std::uint32_t size, std::uint32_t flags) const {
  const auto found = blocks_.find(number);
  if (found == blocks_.end() || (found->second.flags & flags) != flags) return std::nullopt;
  const std::span<std::uint8_t> all = found->second.memory.bytes();
  if (offset > all.size() || size > all.size() - offset) return std::nullopt;
  return all.subspan(offset, size);
}

}  // namespace hosted_tee
