// What a context of the Client API is connected to: a device in this process, or a server.
#ifndef TEE_CLIENT_TEE_LINK_H_
#define TEE_CLIENT_TEE_LINK_H_

#include <cstdint>
#include <memory>

#include "tee/client/parameters.h"
#include "tee_client_api.h"
#include "tee_internal_api.h"

namespace hosted_tee {

class tee_link;

/// What TEEC_SharedMemory.imp.block points at. Its end is the memory's release.
class shared_block {
 public:
  explicit shared_block(std::shared_ptr<tee_link> owner) : owner_(std::move(owner)) {}
  shared_block(const shared_block&) = delete;
  shared_block& operator=(const shared_block&) = delete;
  virtual ~shared_block() = default;

  [[nodiscard]] const std::shared_ptr<tee_link>& owner() const { return owner_; }

  /// The memory that was allocated for the client; null for a block that stands for memory of the client's own.
  [[nodiscard]] virtual void* allocated() const = 0;

 private:
  std::shared_ptr<tee_link> owner_;
};

/// One way to a TEE. Contexts, sessions and shared memory hold it by shared_ptr; its calls may come from any thread.
/// Results and origins are those of the Client API. All functions throw client_failure for what they can't ask the TEE.
class tee_link : public std::enable_shared_from_this<tee_link> {
 public:
  tee_link() = default;
  tee_link(const tee_link&) = delete;
  tee_link& operator=(const tee_link&) = delete;
  virtual ~tee_link() = default;

  /// open_session logs in as TEEC_OpenSession is told, and leaves a number in `session` when it succeeds.
  virtual TEEC_Result open_session(const TEE_UUID& ta, std::uint32_t method, const void* connection_data,
                                   client_params& params, std::uint32_t& session, std::uint32_t& origin) = 0;
  virtual TEEC_Result invoke(std::uint32_t session, std::uint32_t command, client_params& params,
                             std::uint32_t& origin) = 0;
  virtual void close_session(std::uint32_t session) = 0;

  /// share_own makes `memory.size` bytes at memory.buffer ready for references. share_new allocates such memory,
  /// zeroed.
  [[nodiscard]] virtual std::unique_ptr<shared_block> share_own(const TEEC_SharedMemory& memory) = 0;
  [[nodiscard]] virtual std::unique_ptr<shared_block> share_new(const TEEC_SharedMemory& memory) = 0;
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_TEE_LINK_H_
