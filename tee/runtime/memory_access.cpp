#include "tee/runtime/memory_access.h"

#include <fstream>
#include <limits>
#include <string>

namespace hosted_tee {
namespace {

struct range {
  std::uintptr_t begin;
  std::uintptr_t end;
};

bool overlap(const range& a, const range& b) {
  return a.begin < b.end && b.begin < a.end;
}

range range_of(const void* buffer, std::uint32_t size) {
  const auto begin = reinterpret_cast<std::uintptr_t>(buffer);
  return {begin, begin + size};
}

bool is_memref(std::uint32_t type) {
  return type >= TEE_PARAM_TYPE_MEMREF_INPUT && type <= TEE_PARAM_TYPE_MEMREF_INOUT;
}

bool belongs_to_client(const instance& self, const range& wanted) {
  for (std::uint32_t i = 0; self.params != nullptr && i < 4; ++i) {
    if (!is_memref(TEE_PARAM_TYPE_GET(self.param_types, i))) continue;
    const auto& memref = self.params[i].memref;
    if (overlap(wanted, range_of(memref.buffer, memref.size))) return true;
  }
  return false;
}

struct mapping {
  range where;
  std::string rights;  // "rwxp", a dash for what is not allowed
};

// A line of /proc/self/maps begins "55d0c000-55d0e000 rw-p ".
std::istream& operator>>(std::istream& in, mapping& out) {
  char dash = 0;
  in >> std::hex >> out.where.begin >> dash >> out.where.end >> out.rights;
  return in.ignore(std::numeric_limits<std::streamsize>::max(), '\n');
}

// The kernel lists the mappings in ascending order, so one pass follows the buffer from mapping to mapping.
bool mapped(range wanted, bool read, bool write) {
  std::ifstream maps("/proc/self/maps");
  for (mapping m; maps >> m;) {
    if (m.where.end <= wanted.begin) continue;
    if (m.where.begin > wanted.begin) return false;
    if ((read && m.rights[0] != 'r') || (write && m.rights[1] != 'w')) return false;
    if (m.where.end >= wanted.end) return true;
    wanted.begin = m.where.end;
  }
  return false;
}

}  // namespace

bool may_access(const instance& self, std::uint32_t flags, const void* buffer, std::uint32_t size) {
  if (size == 0) return true;
  const range wanted = range_of(buffer, size);
  if (buffer == nullptr || wanted.end < wanted.begin) return false;
  if ((flags & TEE_MEMORY_ACCESS_ANY_OWNER) == 0 && belongs_to_client(self, wanted)) return false;
  return mapped(wanted, (flags & TEE_MEMORY_ACCESS_READ) != 0, (flags & TEE_MEMORY_ACCESS_WRITE) != 0);
}

}  // namespace hosted_tee
