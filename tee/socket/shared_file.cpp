#include "tee/socket/shared_file.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/statfs.h>

#include <cerrno>
#include <system_error>

namespace hosted_tee {
namespace {

constexpr int size_seals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;

[[noreturn]] void fail(const char* what) {
  throw std::system_error(errno, std::generic_category(), what);
}

}  // namespace

mapped_memory::~mapped_memory() {
  if (!bytes_.empty()) ::munmap(bytes_.data(), bytes_.size());
}

// A file that the system does not let be emptied keeps its pages.
void mapped_memory::empty_file() const {
  if (!bytes_.empty()) (void)::madvise(bytes_.data(), bytes_.size(), MADV_REMOVE);
}

std::optional<mapped_memory> map_file(int fd, std::size_t size) {
  void* const place = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
  if (place == MAP_FAILED) return std::nullopt;
  return mapped_memory({static_cast<std::uint8_t*>(place), size});
}

shared_file make_shared_file(std::size_t size) {
  file_descriptor file(::memfd_create("keymaster-shared-memory", MFD_CLOEXEC | MFD_ALLOW_SEALING));
  if (!file.is_open()) fail("memfd_create");
  if (::ftruncate(file.get(), static_cast<off_t>(size)) != 0) fail("ftruncate");
  if (::fcntl(file.get(), F_ADD_SEALS, size_seals) != 0) fail("F_ADD_SEALS");
  std::optional<mapped_memory> memory = map_file(file.get(), size);
  if (!memory) fail("mmap");
  return {std::move(file), std::move(*memory)};
}

// Huge pages are refused with everything else that is not plain memory: they can be missing when they are touched.
bool is_safe_to_share(int fd, std::size_t size) {
  struct statfs where {};
  struct stat facts {};
  const int seals = ::fcntl(fd, F_GET_SEALS);
  if (seals < 0 || (seals & size_seals) != size_seals) return false;
  if (::fstatfs(fd, &where) != 0 || where.f_type != TMPFS_MAGIC) return false;
  return ::fstat(fd, &facts) == 0 && facts.st_size >= 0 && static_cast<std::size_t>(facts.st_size) >= size;
}

}  // namespace hosted_tee
