// A device behind a server.
#ifndef TEE_CLIENT_REMOTE_LINK_H_
#define TEE_CLIENT_REMOTE_LINK_H_

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "tee/client/request_channel.h"
#include "tee/client/tee_link.h"
#include "tee/socket/shared_file.h"

namespace hosted_tee {

/// Memory that the server knows by a number.
struct known_memory {
  mapped_memory memory;
  std::uint32_t block = 0;
};

/// Small temporary references travel in the frames. Larger ones are copied through shared memory that the link keeps
/// for that, and so are references to memory that the client registered; memory that it allocated is the TA's own view.
class remote_link final : public tee_link {
 public:
  /// Throws as request_channel does.
  explicit remote_link(const std::string& path) : channel_(path) {}

  TEEC_Result open_session(const TEE_UUID& ta, std::uint32_t method, const void* connection_data, client_params& params,
                           std::uint32_t& session, std::uint32_t& origin) override;
  TEEC_Result invoke(std::uint32_t session, std::uint32_t command, client_params& params,
                     std::uint32_t& origin) override;
  void close_session(std::uint32_t session) override;
  std::unique_ptr<shared_block> share_own(const TEEC_SharedMemory& memory) override;
  std::unique_ptr<shared_block> share_new(const TEEC_SharedMemory& memory) override;

  /// forget tells the server that the memory is not needed any more.
  void forget(std::uint32_t block) noexcept;

 private:
  [[nodiscard]] std::unique_lock<std::mutex> lock();
  [[nodiscard]] known_memory make_known(std::size_t size, std::uint32_t flags);
  [[nodiscard]] known_memory& staging(std::size_t size);
  void tidy_staging() noexcept;  // after an answer, which nothing may take back
  void release(std::uint32_t block);
  void give_back(std::uint32_t block) noexcept;

  std::mutex mutex_;  // guards what follows; held from a request to the last use of its answer
  request_channel channel_;
  std::optional<known_memory> staging_;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_REMOTE_LINK_H_
