// A file that vanishes unless it is put in its place.
#ifndef KEYMASTER_CLIENT_KMCTL_TEMPORARY_FILE_H_
#define KEYMASTER_CLIENT_KMCTL_TEMPORARY_FILE_H_

#include <cstddef>
#include <string>

namespace kmctl {

enum class overwrite { never, always };

/// An open file with a name of its own beside the one that it is to get. It is removed when its owner goes, and also
/// when a signal ends the program. Not copyable.
class temporary_file {
 public:
  /// Makes the file, which only its user can read, in the folder of `target`. Throws std::system_error.
  explicit temporary_file(std::string target);
  temporary_file(const temporary_file&) = delete;
  temporary_file& operator=(const temporary_file&) = delete;
  ~temporary_file();

  [[nodiscard]] int descriptor() const { return descriptor_; }

  /// put_in_place gives the file its name. With overwrite::never the kernel decides about an existing one, so that two
  /// writers can't both win: std::system_error with EEXIST. Throws std::system_error; the file then vanishes.
  void put_in_place(overwrite existing);

 private:
  void close();

  std::string target_;
  std::string name_;  ///< empty once the file is in its place
  int descriptor_ = -1;
  std::size_t slot_ = 0;  ///< where signals find the name
};

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_TEMPORARY_FILE_H_
