// The `openssl` command, run in a folder of files.
#ifndef TESTS_OPENSSL_OPENSSL_COMMAND_H_
#define TESTS_OPENSSL_OPENSSL_COMMAND_H_

#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/bytes.h"

namespace testing_support {

struct openssl_result {
  int status = -1;     ///< exit status
  std::string output;  ///< standard output
};

/// openssl runs the command with these arguments in `folder`; what it says on standard error is dropped. Throws
/// std::runtime_error when it can't be run.
openssl_result openssl(const std::filesystem::path& folder, const std::vector<std::string>& arguments);

void write_file(const std::filesystem::path& file, const bytes& content);
bytes read_file(const std::filesystem::path& file);

}  // namespace testing_support

#endif  // TESTS_OPENSSL_OPENSSL_COMMAND_H_
