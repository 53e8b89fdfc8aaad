// What the hosted TEE leaves behind in the memory and on the disk of its host.
#include <gmock/gmock.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstring>
#include <fstream>
#include <new>
#include <sstream>

#include "tee/crypto/secret_bytes.h"
#include "tee/runtime/device.h"
#include "tee/runtime/durable_file.h"
#include "tee/runtime/hex.h"
#include "tee/runtime/instance_heap.h"
#include "tee/runtime/secure_world.h"
#include "tee/storage/sealing.h"
#include "tests/support/device_fixture.h"
#include "tests/tee/host_spy.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::Contains;
using ::testing::ElementsAre;

constexpr std::string_view secret = "a secret of 32 bytes, say a key.";

/// Memory for an object that a test ends itself, to look at what is left.
template <class T>
class remains_of {
 public:
  template <class... Arguments>
  explicit remains_of(Arguments&&... arguments) : object_(new (place_) T(std::forward<Arguments>(arguments)...)) {}
  T& operator*() { return *object_; }
  std::string end() {
    object_->~T();
    return {reinterpret_cast<const char*>(place_), sizeof place_};
  }

 private:
  alignas(T) unsigned char place_[sizeof(T)] = {};
  T* object_;
};

TEST(Wiping, AStorageKeyAndASealerLeaveNothing) {
  remains_of<storage_key> key;
  std::memcpy((*key).bytes().data(), secret.data(), secret.size());
  remains_of<sealer> with_copy(*key);
  EXPECT_EQ(with_copy.end().find(secret), std::string::npos);
  EXPECT_EQ(std::memcmp((*key).bytes().data(), secret.data(), secret.size()), 0) << "the copy's end is its own";
  EXPECT_EQ(key.end().find(secret), std::string::npos);
}

TEST(Wiping, ADeviceLeavesNoBootSeed) {
  remains_of<device_services> device;
  std::memcpy((*device).boot_seed.data(), secret.data(), secret.size());
  EXPECT_EQ(device.end().find(secret), std::string::npos);
}

TEST(Wiping, WhatATaDidNotFreeIsWipedWithItsHeap) {
  const watch notes;
  {
    instance_heap heap(4096);
    std::memcpy(heap.allocate(secret.size(), true), secret.data(), secret.size());
    EXPECT_EQ(spy.times_wiped(std::string(secret)), 0);
  }
  EXPECT_EQ(spy.times_wiped(std::string(secret)), 1);
}

TEST(Wiping, SecretBytesAreWipedWhenTheyGrowAndWhenTheyGo) {
  const watch notes;
  {
    secret_bytes bytes(secret.begin(), secret.end());
    bytes.shrink_to_fit();
    bytes.push_back('!');
    EXPECT_EQ(spy.times_wiped(std::string(secret)), 1);
  }
  EXPECT_EQ(spy.times_wiped(std::string(secret) + "!"), 1);
}

class HostTest : public ::testing::Test {
 protected:
  HostTest() { options.state = folder.path() / "a" / "b" / "state"; }

  static ino_t number_of(const fs::path& file) {
    struct stat about {};
    EXPECT_EQ(::stat(file.c_str(), &about), 0);
    return about.st_ino;
  }
  static std::string read(const fs::path& file) {
    std::ostringstream out;
    out << std::ifstream(file).rdbuf();
    return out.str();
  }
  /// files lists the names in the test's folder.
  std::vector<std::string> files() const {
    std::vector<std::string> names;
    for (const auto& entry : fs::directory_iterator(folder.path())) names.push_back(entry.path().filename());
    return names;
  }

  ::testing_support::temporary_folder folder;
  world_options options;
};

TEST_F(HostTest, TheTextWithTheStorageKeyIsWipedWhenItIsWrittenAndWhenItIsRead) {
  for (const char* start : {"the first start", "a later one"}) {
    const watch notes;
    (void)secure_world::open(options);
    const std::string text = read(options.state / "device");
    const std::string digits = text.substr(text.find("storage-key = ") + 14, 64);
    ASSERT_EQ(digits.size(), 64U);
    EXPECT_GE(spy.times_wiped("storage-key = " + digits), 1) << start;
    std::string key(32, '\0');
    ASSERT_TRUE(from_hex(digits, {reinterpret_cast<std::uint8_t*>(key.data()), key.size()}));
    EXPECT_GE(spy.times_wiped(key), 4) << start << ": that of the folder, of both stores and of the counter";
  }
}

TEST_F(HostTest, ANewStateFolderIsOnTheDiskWithTheFoldersAboveIt) {
  const watch notes;
  (void)secure_world::open(options);
  EXPECT_THAT(spy.flushed, Contains(number_of(folder.path())));
  EXPECT_THAT(spy.flushed, Contains(number_of(folder.path() / "a")));
  EXPECT_THAT(spy.flushed, Contains(number_of(folder.path() / "a" / "b")));
}

TEST_F(HostTest, AFileThatCantBeReplacedStaysAndNoTemporaryOneWithIt) {
  fs::create_directories(folder.path() / "file" / "in the way");
  EXPECT_THROW(write_durably(folder.path() / "file", secret, {}), std::system_error);
  EXPECT_THAT(files(), ElementsAre("file"));
}

TEST_F(HostTest, AFileThatCantBeWrittenWholeStaysTheOldOne) {
  write_durably(folder.path() / "file", "old", {});
  const pid_t child = ::fork();
  if (child == 0) {
    const rlimit small{16, 16};
    ::setrlimit(RLIMIT_FSIZE, &small);
    (void)std::signal(SIGXFSZ, SIG_IGN);
    try {
      write_durably(folder.path() / "file", secret, {});
    } catch (const std::system_error& error) {
      ::_exit(error.code() == std::errc::file_too_large ? 7 : 1);
    }
    ::_exit(0);
  }
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(WEXITSTATUS(status), 7);
  EXPECT_EQ(read(folder.path() / "file"), "old");
  EXPECT_THAT(files(), ElementsAre("file"));
}

}  // namespace
}  // namespace hosted_tee::testing
