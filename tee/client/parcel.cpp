#include "tee/client/parcel.h"

#include <algorithm>
#include <cstring>

#include "tee/client/client_failure.h"
#include "tee/client/remote_block.h"

namespace hosted_tee {
namespace {

// What an operation's temporary references may have together to travel in the frames, which are several times as long.
// Beyond it one copy into shared memory costs less than two through the socket.
constexpr std::size_t carried_limit = std::size_t{16} * 1024;

constexpr std::uint64_t alignment = 64;

std::uint64_t aligned(std::uint64_t size) {
  return (size + alignment - 1) / alignment * alignment;
}

void copy(std::uint8_t* to, const std::uint8_t* from, std::size_t size) {
  if (size != 0) std::memcpy(to, from, size);
}

}  // namespace

parcel::parcel(client_params& params, const std::function<known_memory&(std::size_t)>& staging) : params_(params) {
  slots_.types = params.types();
  std::array<bool, 4> is_temporary{};
  std::uint64_t temporary = 0, staged = 0;  // four lengths of 32 bits
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(slots_.types, i);
    const TEE_Param& given = params.slots()[i];
    if (remote::is_value(type)) {
      slots_.slots[i].a = given.value.a;
      slots_.slots[i].b = given.value.b;
    } else if (remote::is_memory(type)) {
      // The parameters are of this link's context, and so are their blocks.
      const auto* const block = static_cast<const remote_block*>(params.block(i));
      if (block != nullptr) {
        pack_memory(i, block);
      } else if (given.memref.buffer != nullptr) {
        is_temporary[i] = true;
        temporary += given.memref.size;
        staged += aligned(given.memref.size);
      }
    }
  }
  if (temporary <= carried_limit) {
    for (std::size_t i = 0; i < 4; ++i) {
      if (is_temporary[i]) carry(i);
    }
    return;
  }
  if (staged > TEEC_CONFIG_SHAREDMEM_MAX_SIZE) throw client_failure(TEEC_ERROR_EXCESS_DATA);
  known_memory& memory = staging(static_cast<std::size_t>(staged));
  std::size_t used = 0;
  for (std::size_t i = 0; i < 4; ++i) {
    if (is_temporary[i]) stage(i, memory, used);
  }
}

void parcel::pack_memory(std::size_t slot, const remote_block* block) {
  const auto& given = params_.slots()[slot].memref;
  auto* const own = static_cast<std::uint8_t*>(given.buffer);
  const std::size_t offset =
      reinterpret_cast<std::uintptr_t>(own) - reinterpret_cast<std::uintptr_t>(block->clients_view());
  const std::span<std::uint8_t> all = block->bytes();
  // The reference was within the memory as the client describes it now; this is how it was registered.
  if (offset > all.size() || given.size > all.size() - offset) throw client_failure(TEEC_ERROR_BAD_PARAMETERS);
  remote::request_slot& out = slots_.slots[slot];
  out.source = remote::memory_source::shared;
  out.block = block->number();
  out.offset = static_cast<std::uint32_t>(offset);
  out.size = given.size;
  if (!block->is_copy()) return;
  copies_[slot] = {all.subspan(offset, given.size), own};
  copy(copies_[slot].shared.data(), own, given.size);
}

void parcel::carry(std::size_t slot) {
  const auto& given = params_.slots()[slot].memref;
  remote::request_slot& out = slots_.slots[slot];
  out.source = remote::memory_source::carried;
  out.size = given.size;
  out.data = {static_cast<const std::uint8_t*>(given.buffer), given.size};
}

void parcel::stage(std::size_t slot, known_memory& memory, std::size_t& used) {
  const auto& given = params_.slots()[slot].memref;
  auto* const own = static_cast<std::uint8_t*>(given.buffer);
  remote::request_slot& out = slots_.slots[slot];
  out.source = remote::memory_source::shared;
  out.block = memory.block;
  out.offset = static_cast<std::uint32_t>(used);
  out.size = given.size;
  copies_[slot] = {memory.memory.bytes().subspan(used, given.size), own};
  copy(copies_[slot].shared.data(), own, given.size);
  used += static_cast<std::size_t>(aligned(given.size));
}

bool parcel::is_answered_by(const remote::answer_slots& answer) const {
  if (answer.types != slots_.types) return false;
  for (std::size_t i = 0; i < 4; ++i) {
    if (slots_.slots[i].source != remote::memory_source::carried) continue;
    const std::size_t room = std::min(answer.slots[i].size, slots_.slots[i].size);
    if (answer.slots[i].data.size() > room) return false;
  }
  return true;
}

// Unless the TA was reached there is nothing in the shared memory but what an earlier operation left.
void parcel::unpack_memory(std::size_t slot, const remote::answer_slot& answer, bool reached_ta) {
  auto& given = params_.slots()[slot].memref;
  if (slots_.slots[slot].source == remote::memory_source::carried) {
    copy(static_cast<std::uint8_t*>(given.buffer), answer.data.data(), answer.data.size());
  } else if (reached_ta && copies_[slot].own != nullptr) {
    copy(copies_[slot].own, copies_[slot].shared.data(), std::min<std::size_t>(answer.size, given.size));
  }
  given.size = answer.size;
}

void parcel::unpack(const remote::outcome& done, const remote::answer_slots& answer) {
  if (done.origin == TEEC_ORIGIN_COMMS) return;
  for (std::size_t i = 0; i < 4; ++i) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(slots_.types, i);
    if (!remote::comes_out(type)) continue;
    if (remote::is_value(type)) {
      params_.slots()[i].value = {answer.slots[i].a, answer.slots[i].b};
    } else {
      unpack_memory(i, answer.slots[i], done.origin == TEEC_ORIGIN_TRUSTED_APP);
    }
  }
}

}  // namespace hosted_tee
