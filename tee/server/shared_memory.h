// The shared memory that a connection has.
#ifndef TEE_SERVER_SHARED_MEMORY_H_
#define TEE_SERVER_SHARED_MEMORY_H_

#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <span>
#include <unordered_map>
#include <utility>

#include "tee/server/limits.h"
#include "tee/socket/shared_file.h"
#include "tee_client_api.h"

namespace hosted_tee {

/// Whose memory it is.
struct memory_holder {
  uid_t user = 0;
  pid_t process = 0;
};

/// What all connections together have mapped, and whose it is. Any thread may use it.
class memory_account {
 public:
  memory_account() = default;
  memory_account(const memory_account&) = delete;
  memory_account& operator=(const memory_account&) = delete;
  ~memory_account() = default;

  [[nodiscard]] std::uint32_t blocks() const { return blocks_; }
  [[nodiscard]] std::uint64_t bytes() const { return bytes_; }

 private:
  friend class memory_place;

  [[nodiscard]] bool add(const memory_holder& holder, std::uint64_t bytes, const server_limits& limits);
  void remove(const memory_holder& holder, std::uint64_t bytes) noexcept;

  std::mutex mutex_;  // for whoever changes something
  std::atomic<std::uint32_t> blocks_{0};
  std::atomic<std::uint64_t> bytes_{0};
  std::map<uid_t, std::uint64_t> of_users_;
  std::map<std::pair<uid_t, pid_t>, std::uint64_t> of_processes_;
};

/// A place in the account, which is given back at its end.
class memory_place {
 public:
  memory_place(memory_place&& other) noexcept
      : account_(std::exchange(other.account_, nullptr)), holder_(other.holder_), bytes_(other.bytes_) {}
  memory_place& operator=(memory_place&&) = delete;
  ~memory_place();

  /// take answers nothing when the holder's process, its user or all together would have more bytes than `limits` gives
  /// them.
  [[nodiscard]] static std::optional<memory_place> take(memory_account& account, const memory_holder& holder,
                                                        std::uint64_t bytes, const server_limits& limits);

 private:
  memory_place(memory_account& account, const memory_holder& holder, std::uint64_t bytes)
      : account_(&account), holder_(holder), bytes_(bytes) {}

  memory_account* account_;
  memory_holder holder_;
  std::uint64_t bytes_;
};

/// The blocks of one connection, by their numbers. They end with it.
class block_collection {
 public:
  block_collection(const server_limits& limits, memory_account& account, const memory_holder& holder = {})
      : limits_(limits), account_(account), holder_(holder) {}
  block_collection(const block_collection&) = delete;
  block_collection& operator=(const block_collection&) = delete;
  ~block_collection() = default;

  /// add maps the first `size` bytes of a client's file. TEEC_ERROR_BAD_PARAMETERS for no bytes, flags that don't exist
  /// and a file that is not safe to share; TEEC_ERROR_OUT_OF_MEMORY when a limit is passed or the system has no room,
  /// with a `file` of -1 not even for its descriptor.
  [[nodiscard]] TEEC_Result add(int file, std::uint32_t size, std::uint32_t flags, std::uint32_t& number);

  /// Whoever touches a page first pays for it, with a client's file as with any other: without this a client could keep
  /// as many files as it likes that are filled at the server's expense. So what ends is emptied. remove answers whether
  /// there was such a block.
  bool remove(std::uint32_t number);
  void remove_all();

  /// clear lets go of the blocks and leaves the files as they are.
  void clear() { blocks_.clear(); }

  /// part gives bytes of a block, for references in the directions of `flags`. Nothing when there is no such block, it
  /// does not have these bytes, or it was not made for these directions.
  [[nodiscard]] std::optional<std::span<std::uint8_t>> part(std::uint32_t number, std::uint32_t offset,
                                                            std::uint32_t size, std::uint32_t flags) const;

 private:
  struct block {
    memory_place place;
    mapped_memory memory;
    std::uint32_t flags;
  };

  [[nodiscard]] std::uint64_t bytes() const;

  const server_limits& limits_;
  memory_account& account_;
  memory_holder holder_;
  std::unordered_map<std::uint32_t, block> blocks_;
  std::uint32_t last_number_ = 0;
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_SHARED_MEMORY_H_
