// Owner of a file descriptor.
#ifndef TEE_RUNTIME_FILE_DESCRIPTOR_H_
#define TEE_RUNTIME_FILE_DESCRIPTOR_H_

#include <unistd.h>

#include <utility>

namespace hosted_tee {

class file_descriptor {
 public:
  file_descriptor() = default;
  explicit file_descriptor(int fd) : fd_(fd) {}
  file_descriptor(file_descriptor&& other) noexcept : fd_(other.release()) {}
  file_descriptor& operator=(file_descriptor&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  ~file_descriptor() {
    if (fd_ >= 0) ::close(fd_);
  }

  [[nodiscard]] int get() const { return fd_; }
  [[nodiscard]] bool is_open() const { return fd_ >= 0; }
  int release() { return std::exchange(fd_, -1); }

 private:
  int fd_ = -1;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_FILE_DESCRIPTOR_H_
