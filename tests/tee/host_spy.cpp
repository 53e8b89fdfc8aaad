#include "tests/tee/host_spy.h"

#include <dlfcn.h>
#include <openssl/crypto.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>

namespace hosted_tee::testing {

host_spy spy;

int host_spy::times_wiped(const std::string& secret) const {
  return static_cast<int>(std::count_if(
      wiped.begin(), wiped.end(), [&](const std::string& piece) { return piece.find(secret) != std::string::npos; }));
}

watch::watch() {
  spy = {};
  spy.watching = true;
}

watch::~watch() {
  spy = {};
}

namespace {

/// The definition of `function` that this program's own hides.
template <class Function>
Function* real(Function* /*function*/, const char* name) {
  void* const found = dlsym(RTLD_NEXT, name);
  if (found == nullptr) std::abort();
  return reinterpret_cast<Function*>(found);
}

}  // namespace
}  // namespace hosted_tee::testing

using hosted_tee::testing::real;
using hosted_tee::testing::spy;

extern "C" {

void OPENSSL_cleanse(void* memory, size_t size) {
  static const auto cleanse = real(OPENSSL_cleanse, __func__);
  if (spy.watching) spy.wiped.emplace_back(static_cast<const char*>(memory), size);
  cleanse(memory, size);
}

int fsync(int fd) {
  static const auto flush = real(fsync, __func__);
  struct stat about {};
  if (spy.watching && ::fstat(fd, &about) == 0) spy.flushed.push_back(about.st_ino);
  return flush(fd);
}
}
